/*
 * Value parsing as the kernel's configfs store routines do it (kstrtoull, kstrtobool,
 * strings with their trailing newline cut), and the checks built from them that the
 * kind table attaches to attribute files.
 */
#ifndef ORLO_SIM_CONFIGFS_VALUES_H
#define ORLO_SIM_CONFIGFS_VALUES_H

#include <cstdint>
#include <string>
#include <vector>

#include "configfs_sim.h"

namespace orlosim {

// kstrtoull: optional '+', base 0 (0x hex, 0 octal, else decimal), digits, at most
// one trailing newline.  0, EINVAL or ERANGE.
int KStrToULL(const std::string &s, unsigned long long *out);
int KStrToU32(const std::string &s, uint32_t *out);
// kstrtobool: looks at the first characters only (1/y/Y/on, 0/n/N/off).
int KStrToBool(const std::string &s, bool *out);
// The text with one trailing newline removed.
std::string Chomp(const std::string &s);
// The text with all trailing white space removed.
std::string StripRight(const std::string &s);
bool IsUuid(const std::string &s);

// Checks for the kind table.
CheckFn U32Range(uint32_t lo, uint32_t hi);         // kstrtou32 and lo..hi
CheckFn U32Set(std::vector<uint32_t> allowed);      // kstrtou32 and one of the values
CheckFn Bool01();                                   // kstrtou32 and 0 or 1
CheckFn KBool();                                    // kstrtobool, stored as 0/1
CheckFn Text(size_t maxLen);                        // newline cut; longer is EINVAL
CheckFn Uuid();                                     // a 36-character UUID
CheckFn Word(size_t maxLen);                        // [A-Za-z0-9_-]+
// iSCSI negotiation keys, checked as the login parameter table checks them.
CheckFn ParamNumber(unsigned long lo, unsigned long hi);
CheckFn ParamYesNo();
CheckFn ParamList(std::vector<std::string> allowed);  // comma-separated, each allowed
CheckFn ParamText(size_t maxLen);

}  // namespace orlosim

#endif
