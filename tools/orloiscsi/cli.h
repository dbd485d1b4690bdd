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
#include <string>
#include <vector>

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

// Prints "error: <code> <message>" on stderr and returns the exit status 1.
int Fail(uint32_t code);
// Prints "usage: ..." for the action on stderr and returns 2.
int Usage(const Object &obj, const Action &act);
// Parses a whole unsigned or negative decimal number (also 0x hex); false when malformed.
bool ParseCode(const std::string &s, uint32_t *out);
// Escapes a string for a JSON document.
std::string JsonQuote(const std::string &s);

}  // namespace cli

#endif
