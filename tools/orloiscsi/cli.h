/*
 * orloiscsi: the administrator's command line for the appliance's iSCSI service.
 *
 *   orloiscsi [--root DIR] [--json] OBJECT ACTION [ARGS]
 *
 * Each object family registers a table of actions; main() picks the object, the object
 * picks the action.  Actions call the library's functions only, print what a person
 * wants to see (or JSON with --json) and exit 0; on failure they print
 * "error: <code> <message>" on standard error and exit 1.  Usage errors exit 2.
 */
#ifndef ORLOISCSI_CLI_H
#define ORLOISCSI_CLI_H

#include <cstdint>
#include <map>
#include <string>
#include <vector>

#include "orloiscsi_lun.h"
#include "orloiscsi_target.h"

namespace cli {

struct Context {
    bool json = false;
};

using Args = std::vector<std::string>;

struct Action {
    const char *name;
    const char *usage;    // arguments, e.g. "FILE SECTION KEY=VALUE..."
    const char *summary;  // one line
    int (*run)(const Context &ctx, const Args &args);
};

struct Object {
    const char *name;
    const char *summary;
    const Action *actions;  // ends with an entry whose name is nullptr
};

// Registered object tables (one per source file).
extern const Object kErrstrObject;
extern const Object kConfObject;
extern const Object kLunObject;
extern const Object kEpObject;
extern const Object kModulesObject;
extern const Object kServiceObject;
extern const Object kTargetObject;
extern const Object kMapObject;
extern const Object kAclObject;
extern const Object kSelftestObject;

// Prints "error: <code> <message>" on stderr and returns the exit status 1.
int Fail(uint32_t code);
// Prints "usage: ..." for the action on stderr and returns 2.
int Usage(const Object &obj, const Action &act);
// Parses a whole unsigned or negative decimal number (also 0x hex); false when malformed.
bool ParseCode(const std::string &s, uint32_t *out);
// Escapes a string for a JSON document.
std::string JsonQuote(const std::string &s);
// Parses a whole decimal number within [min, max]; false when malformed or outside.
bool ParseNumber(const std::string &s, long min, long max, long *out);

// The options an action takes: "--name" alone (a switch) or followed by a value, given
// as "--name VALUE" or "--name=VALUE".  A repeated option keeps every value in order.
struct OptionSpec {
    const char *name;
    bool takesValue;
};
struct ParsedOptions {
    std::map<std::string, std::vector<std::string>> values;  // switches hold one empty value
    Args positional;
    bool Has(const std::string &name) const { return values.count(name) != 0; }
    // The last value given for the option ("" when absent).
    std::string Last(const std::string &name) const {
        auto it = values.find(name);
        return it == values.end() || it->second.empty() ? std::string() : it->second.back();
    }
    const std::vector<std::string> &All(const std::string &name) const;
};
// Splits args by specs (ends with a null name).  Prints why and returns false for an
// unknown option, a missing value, or an option that would put a secret on the
// command line (secrets come from a file or the terminal, never from argv).
bool ParseOptionList(const Args &args, const OptionSpec *specs, ParsedOptions *out);

// Finds a target by tid (a number) or name, backup-object targets included.  0 or a
// result code; a message has been printed for a tid out of range.
uint32_t FindTarget(const std::string &ref, ORLOiSCSITarget *target);
// Finds a LUN by name, lid (a number) or uuid, backup objects included.  0 or a result
// code (18990531 when there is none).
uint32_t FindLun(const std::string &ref, ORLOiSCSILun *lun);

}  // namespace cli

#endif
