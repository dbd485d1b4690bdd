/*
 * orloiscsi: the administrator's command line for the appliance's iSCSI service.
 *
 *   orloiscsi [--root DIR] [--json] [--verbose|--quiet] OBJECT ACTION [ARGS]
 *
 * The command line is described once, with CLI11: every object is a subcommand of the
 * tool and every action a subcommand of its object (errstr, selftest and overview are
 * actions of their own).  Each object family's source file registers its actions here,
 * with their options bound to the action's variables and the function that runs it; the
 * help texts, the usage lines printed with a usage error and the words bash completion
 * offers are all made from that one description.
 *
 * Actions call the library's functions only, print what a person wants to see (or one
 * JSON document with --json, made with json-c) and return the exit status: 0, 1 when
 * the operation failed (Fail prints "error: <code> <message>" and the library's log
 * lines that say why), 2 for a command line that cannot be understood (UsageError).
 */
#ifndef ORLOISCSI_CLI_H
#define ORLOISCSI_CLI_H

#include <json-c/json.h>

#include <CLI/CLI.hpp>
#include <cstdint>
#include <functional>
#include <utility>
#include <string>
#include <vector>

#include "orloiscsi_lun.h"
#include "orloiscsi_target.h"

namespace cli {

// ---- Global options ----

struct Context {
    bool json = false;
    bool verbose = false;  // the library's informational log lines too
    bool quiet = false;    // no log lines, only the error line
};
// The options of this run (filled by the parse, read by the actions).
const Context &Ctx();
Context &MutableCtx();

const int kExitFailure = 1;
const int kExitUsage = 2;

// ---- Describing the command line ----

// What an action needs besides its own arguments.
enum ActionFlag : unsigned {
    kNeedsRoot = 0,     // works on the appliance tree: the root is checked and prepared first
    kLeavesRoot = 1u,   // never touches the appliance tree (errstr, help, completion)
};

// An object: a group of actions, "orloiscsi OBJECT ACTION".
CLI::App *AddObject(CLI::App *root, const char *name, const char *summary);
// An action of parent (an object, or the tool itself for an action that stands alone),
// run after a successful parse.
CLI::App *AddAction(CLI::App *parent, const char *name, const char *summary, std::function<int()> run,
                    unsigned flags = kNeedsRoot);
// A hidden action (completion words, "help"): not listed anywhere.
CLI::App *AddHiddenAction(CLI::App *parent, const char *name, std::function<int()> run);

// One positional argument of an action, shown as placeholder.  Positionals are filled
// in the order they are added.
CLI::Option *AddPositional(CLI::App *action, const char *placeholder, std::string *value, const char *description,
                           bool required = true);
// Every remaining positional argument ("CODE...").
CLI::Option *AddPositionals(CLI::App *action, const char *placeholder, std::vector<std::string> *values,
                            const char *description, bool required = true);
// An option that names what the positional slot names (the option create takes: "--name
// NAME" for "LUN" or "TARGET").  Its value goes into the slot's variable; the words
// given for the slot and the ones after it move one place on.
CLI::Option *AddAlias(CLI::App *action, CLI::Option *slot, const char *name, const char *placeholder,
                      const char *description);
// "--name VALUE"; repeated, the last one counts.
CLI::Option *AddValue(CLI::App *action, const char *name, const char *placeholder, std::string *value,
                      const char *description);
// "--name VALUE" that may be repeated; every value is kept in order.
CLI::Option *AddValues(CLI::App *action, const char *name, const char *placeholder, std::vector<std::string> *values,
                       const char *description);
// A switch.
CLI::Option *AddFlag(CLI::App *action, const char *name, bool *value, const char *description);
// Exactly one (required) or at most one of members may be given; a positional member
// counts as given also when its alias is.
void OneOf(CLI::App *action, const std::vector<CLI::Option *> &members, bool required);

// ---- Running ----

// Parses argv against root, checks every action's own rules and returns the action to
// run (nullptr after a usage error, help or version has been printed: *status holds
// the exit status).
struct Chosen {
    std::function<int()> run;
    unsigned flags = kNeedsRoot;
};
bool Parse(CLI::App *root, int argc, char **argv, Chosen *chosen, int *status);
// "usage: orloiscsi OBJECT ACTION ..." of the action that is running.
std::string CurrentUsage();
// The help of app (the tool, an object or an action).
std::string HelpOf(const CLI::App *app);
// The words bash completion offers after the given words (see tools/completion).
std::string CompletionWords(CLI::App *root, const std::vector<std::string> &words);

// ---- Reporting ----

// Starts collecting the library's log lines (they still go to syslog).
void StartLogCapture();
// Prints "error: <code> <message>" on stderr, then the library's log lines collected
// so far (errors and warnings; every line with --verbose; none with --quiet), and
// returns 1.
int Fail(uint32_t code);
// With --verbose, prints the log lines collected and not yet shown.
void ShowRemainingLogLines();
// Prints "orloiscsi: why" and the usage line of the running action on stderr; returns 2.
int UsageError(const std::string &why);

// ---- JSON documents (json-c), printed with one fixed set of flags ----

class Json {
  public:
    static Json Object();
    static Json Array();
    static Json Str(const std::string &s);
    static Json Int(int64_t v);
    static Json Uint(uint64_t v);
    static Json Bool(bool v);
    static Json Null();

    Json() = default;
    Json(Json &&other) noexcept : obj_(other.obj_) { other.obj_ = nullptr; }
    Json &operator=(Json &&other) noexcept;
    Json(const Json &) = delete;
    Json &operator=(const Json &) = delete;
    ~Json();

    // Object members, in the order they are set.  Each returns the document, so that
    // calls chain; on a temporary they return it for moving on.
    Json &Set(const char *key, Json value) &;
    Json &SetStr(const char *key, const std::string &s) & { return Set(key, Str(s)); }
    Json &SetInt(const char *key, int64_t v) & { return Set(key, Int(v)); }
    Json &SetUint(const char *key, uint64_t v) & { return Set(key, Uint(v)); }
    Json &SetBool(const char *key, bool v) & { return Set(key, Bool(v)); }
    Json &&Set(const char *key, Json value) && { return std::move(Set(key, std::move(value))); }
    Json &&SetStr(const char *key, const std::string &s) && { return std::move(SetStr(key, s)); }
    Json &&SetInt(const char *key, int64_t v) && { return std::move(SetInt(key, v)); }
    Json &&SetUint(const char *key, uint64_t v) && { return std::move(SetUint(key, v)); }
    Json &&SetBool(const char *key, bool v) && { return std::move(SetBool(key, v)); }
    // Array elements.
    Json &Push(Json value) &;
    Json &&Push(Json value) && { return std::move(Push(std::move(value))); }

    // The document as one line (no blanks, "/" left as it is).
    std::string Text() const;

  private:
    explicit Json(json_object *obj) : obj_(obj) {}
    json_object *obj_ = nullptr;
};
// Prints doc and a newline on standard output.
void PrintJson(const Json &doc);

// ---- Shared helpers ----

// Parses a whole unsigned or negative decimal number (also 0x hex); false when malformed.
bool ParseCode(const std::string &s, uint32_t *out);
// Parses a whole decimal number within [min, max]; false when malformed or outside.
bool ParseNumber(const std::string &s, long min, long max, long *out);
bool AllDigits(const std::string &s);

// Finds a target by tid (a number) or name, backup-object targets included.  0 or a
// result code; a message has been printed for a tid out of range.
uint32_t FindTarget(const std::string &ref, ORLOiSCSITarget *target);
// Finds a LUN by name, lid (a number) or uuid, backup objects included.  0 or a result
// code (18990531 when there is none).
uint32_t FindLun(const std::string &ref, ORLOiSCSILun *lun);

// Kernel-state words shared by target and overview.
const char *KernelState(int statusWord);
const char *AuthName(int32_t authType);
const char *AuthKey(int32_t authType);
const char *ConnectionName(char state);
const char *PermissionWord(int32_t authority);
std::string HumanSize(uint64_t bytes);
std::vector<std::string> SplitPortals(const char *list);

// ---- Object families (one source file each) ----

void RegisterLun(CLI::App *root);
void RegisterTarget(CLI::App *root);
void RegisterMap(CLI::App *root);
void RegisterAcl(CLI::App *root);
void RegisterSnapshot(CLI::App *root);
void RegisterEp(CLI::App *root);
void RegisterService(CLI::App *root);  // service, modules, selftest
void RegisterConf(CLI::App *root);
void RegisterErrstr(CLI::App *root);
void RegisterIsns(CLI::App *root);
void RegisterOverview(CLI::App *root);

}  // namespace cli

#endif
