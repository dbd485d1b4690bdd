// The one description of the command line: objects and actions as CLI11 subcommands,
// with what CLI11 does not know about them (placeholders, positional slots and their
// aliases, one-of groups, the function that runs each action).  Help, usage lines and
// completion words are all made from it.
#include <algorithm>
#include <cstdio>
#include <map>
#include <memory>
#include <set>
#include <sstream>

#include "cli.h"

namespace cli {

namespace {

// A positional argument naming one thing, possibly also given by an alias option.
struct Slot {
    CLI::Option *opt = nullptr;
    std::string *value = nullptr;
    CLI::Option *alias = nullptr;
    std::string aliasValue;
    bool required = true;
    bool present = false;  // after Resolve
};

struct Group {
    std::vector<CLI::Option *> members;
    bool required = true;
};

struct ActionInfo {
    std::function<int()> run;
    unsigned flags = kNeedsRoot;
    std::vector<std::unique_ptr<Slot>> slots;
    CLI::Option *rest = nullptr;  // "CODE...": every remaining positional
    bool restRequired = false;
};

struct Registry {
    std::map<const CLI::App *, ActionInfo> actions;
    std::map<const CLI::App *, std::vector<Group>> groups;  // of actions and of the tool itself
    std::map<const CLI::App *, std::string> summaries;
    std::set<const CLI::App *> hidden;
    std::map<const CLI::Option *, std::string> placeholders;
    std::map<const CLI::Option *, Slot *> slotOf;     // a slot's positional and its alias
    std::set<const CLI::Option *> repeatable;
    const CLI::App *running = nullptr;
};

Registry &Reg() {
    static Registry r;
    return r;
}

Context gContext;

// A usage mistake found after CLI11's own checks.
struct UsageProblem {
    std::string why;
};

bool IsHelpFlag(const CLI::App *app, const CLI::Option *opt) { return opt == app->get_help_ptr(); }

std::string CommandPath(const CLI::App *app) {
    std::vector<std::string> names;
    for (const CLI::App *a = app; a != nullptr; a = a->get_parent()) names.push_back(a->get_name());
    std::string path;
    for (auto it = names.rbegin(); it != names.rend(); ++it) path += (path.empty() ? "" : " ") + *it;
    return path;
}

std::string Placeholder(const CLI::Option *opt) {
    auto it = Reg().placeholders.find(opt);
    return it == Reg().placeholders.end() ? std::string("VALUE") : it->second;
}

// "--name NAME", "--all", "LUN", "CODE...".
std::string RenderOne(const CLI::Option *opt) {
    Registry &r = Reg();
    std::string text;
    if (opt->get_positional()) {
        text = Placeholder(opt);
    } else {
        text = opt->get_name();
        if (opt->get_expected_max() != 0) text += " " + Placeholder(opt);
    }
    if (r.repeatable.count(opt)) text += "...";
    auto s = r.slotOf.find(opt);
    if (s != r.slotOf.end() && s->second->opt == opt && s->second->alias != nullptr)
        text += " | " + RenderOne(s->second->alias);
    return text;
}

const Group *GroupOf(const CLI::App *app, const CLI::Option *opt) {
    auto found = Reg().groups.find(app);
    if (found == Reg().groups.end()) return nullptr;
    for (const Group &g : found->second)
        if (std::find(g.members.begin(), g.members.end(), opt) != g.members.end()) return &g;
    return nullptr;
}

bool IsAlias(const CLI::Option *opt) {
    auto s = Reg().slotOf.find(opt);
    return s != Reg().slotOf.end() && s->second->alias == opt;
}

// The arguments of an action as one line: "LUN | --name NAME | --lid N [--all]".
std::string RenderArguments(const CLI::App *app) {
    Registry &r = Reg();
    std::set<const Group *> done;
    std::vector<std::pair<std::string, bool>> parts;  // text, and whether it holds alternatives
    for (const CLI::Option *opt : app->get_options()) {
        if (IsHelpFlag(app, opt) || IsAlias(opt)) continue;
        std::string part;
        const Group *g = GroupOf(app, opt);
        if (g != nullptr) {
            if (done.count(g)) continue;
            done.insert(g);
            for (const CLI::Option *m : g->members) part += (part.empty() ? "" : " | ") + RenderOne(m);
            if (!g->required) part = "[" + part + "]";
            parts.emplace_back(part, g->required);
            continue;
        }
        bool required = opt->get_required();
        auto s = r.slotOf.find(opt);
        if (s != r.slotOf.end()) required = s->second->required;
        auto act = r.actions.find(app);
        if (act != r.actions.end() && act->second.rest == opt) required = act->second.restRequired;
        part = RenderOne(opt);
        if (!required) part = "[" + part + "]";
        parts.emplace_back(part, required && part.find(" | ") != std::string::npos);
    }
    // Alternatives are bracketed only when something else stands beside them.
    std::string line;
    for (auto &p : parts) {
        std::string text = p.second && parts.size() > 1 ? "(" + p.first + ")" : p.first;
        line += (line.empty() ? "" : " ") + text;
    }
    return line;
}

std::vector<const CLI::App *> VisibleSubcommands(const CLI::App *app) {
    std::vector<const CLI::App *> out;
    for (const CLI::App *sub : app->get_subcommands([](const CLI::App *) { return true; }))
        if (!Reg().hidden.count(sub)) out.push_back(sub);
    return out;
}

bool IsAction(const CLI::App *app) { return Reg().actions.count(app) != 0; }

std::string Summary(const CLI::App *app) {
    auto it = Reg().summaries.find(app);
    return it == Reg().summaries.end() ? std::string() : it->second;
}

std::string UsageLine(const CLI::App *app) {
    if (app->get_parent() == nullptr) return "usage: orloiscsi " + RenderArguments(app) + " OBJECT ACTION [ARGS]";
    if (!IsAction(app)) return "usage: orloiscsi [OPTIONS] " + app->get_name() + " ACTION [ARGS]";
    std::string args = RenderArguments(app);
    return "usage: " + CommandPath(app) + (args.empty() ? "" : " " + args);
}

// Lines "  NAME  description" for every argument and option with a description.
std::string ArgumentList(const CLI::App *app) {
    std::vector<std::pair<std::string, std::string>> rows;
    size_t width = 0;
    for (const CLI::Option *opt : app->get_options()) {
        if (opt->get_description().empty()) continue;
        std::string name;
        if (IsHelpFlag(app, opt)) {
            if (app->get_parent() != nullptr) continue;  // said once, in the tool's own help
            name = "--help, -h";
        } else if (opt->get_positional()) {
            name = Placeholder(opt);
        } else {
            name = opt->get_name();
            if (opt->get_expected_max() != 0) name += " " + Placeholder(opt);
        }
        width = std::max(width, name.size());
        rows.emplace_back(name, opt->get_description());
    }
    std::string out;
    for (auto &row : rows) {
        out += "  " + row.first + std::string(width - row.first.size() + 2, ' ') + row.second + "\n";
    }
    return out;
}

void Resolve(const CLI::App *app, ActionInfo *info) {
    auto &slots = info->slots;
    for (auto &s : slots) s->present = s->opt->count() > 0;
    for (size_t i = 0; i < slots.size(); ++i) {
        Slot &s = *slots[i];
        if (s.alias == nullptr || s.alias->count() == 0) continue;
        if (s.present) {
            // The words given move one slot on: "acl add --name t1 INITIATOR".
            if (slots.back()->present)
                throw UsageProblem{"give " + Placeholder(s.opt) + " or " + s.alias->get_name() + ", not both"};
            for (size_t j = slots.size() - 1; j > i; --j) {
                *slots[j]->value = *slots[j - 1]->value;
                slots[j]->present = slots[j - 1]->present;
            }
        }
        *s.value = s.aliasValue;
        s.present = true;
    }
    for (const Group &g : Reg().groups[app]) {
        std::vector<std::string> names;
        int given = 0;
        for (const CLI::Option *m : g.members) {
            auto it = Reg().slotOf.find(m);
            bool present = it != Reg().slotOf.end() ? it->second->present : m->count() > 0;
            given += present ? 1 : 0;
            std::string name = m->get_positional() ? Placeholder(m) : m->get_name();
            if (it != Reg().slotOf.end() && it->second->alias != nullptr) {
                names.push_back(name);
                name = it->second->alias->get_name();
            }
            names.push_back(name);
        }
        std::string list;
        for (size_t k = 0; k < names.size(); ++k)
            list += (k == 0 ? "" : k + 1 == names.size() ? " or " : ", ") + names[k];
        if (given > 1) throw UsageProblem{"give only one of " + list};
        if (given == 0 && g.required) throw UsageProblem{"give one of " + list};
    }
    for (auto &s : slots) {
        if (s->required && !s->present && GroupOf(app, s->opt) == nullptr)
            throw UsageProblem{"missing " + Placeholder(s->opt)};
    }
    if (info->rest != nullptr && info->restRequired && info->rest->count() == 0)
        throw UsageProblem{"missing " + Placeholder(info->rest)};
}

// CLI11 names positionals with letters, digits and a few marks; the placeholder shown
// may say more ("KEY=VALUE", "iscsi|vhost|tcm|loopback").
std::string PositionalName(const char *placeholder) {
    std::string name;
    for (const char *p = placeholder; *p != '\0'; ++p) {
        char c = *p;
        bool ok = (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9') || c == '_';
        name += ok ? c : '_';
    }
    return name;
}

const CLI::App *Deepest(const CLI::App *root) {
    const CLI::App *a = root;
    for (;;) {
        std::vector<CLI::App *> subs = a->get_subcommands();
        if (subs.empty()) return a;
        a = subs.front();
    }
}

// "The following argument was not expected: --colour" -> the words.
std::vector<std::string> ExtraWords(const std::string &message) {
    std::vector<std::string> words;
    size_t colon = message.find(": ");
    if (colon == std::string::npos) return words;
    std::istringstream in(message.substr(colon + 2));
    std::string w;
    while (in >> w) words.push_back(w);
    return words;
}

bool LooksLikeOption(const std::string &w) {
    if (w.size() < 2 || w[0] != '-') return false;
    return !(w[1] >= '0' && w[1] <= '9');
}

// Says what was wrong with the command line and how it is used; the exit status 2.
int ReportParseError(const CLI::App *root, const CLI::ParseError &e) {
    const CLI::App *at = Deepest(root);
    std::string why = e.what();
    bool group = !IsAction(at);  // the tool or an object: no action chosen
    if (dynamic_cast<const CLI::ExtrasError *>(&e) != nullptr) {
        std::vector<std::string> words = ExtraWords(why);
        std::string option;
        for (const std::string &w : words)
            if (LooksLikeOption(w)) option = w;
        if (!option.empty()) {
            size_t eq = option.find('=');
            why = "unknown option '" + option.substr(0, eq) + "'";
        } else if (group && !words.empty()) {
            why = at->get_parent() == nullptr ? "unknown object '" + words.back() + "'"
                                              : "unknown action '" + at->get_name() + " " + words.back() + "'";
        } else if (words.size() == 1) {
            why = "unexpected argument '" + words[0] + "'";
        }
    } else if (dynamic_cast<const CLI::ArgumentMismatch *>(&e) != nullptr && why.find(" required ") != std::string::npos &&
               why.find(" missing") != std::string::npos) {
        why = why.substr(0, why.find(':')) + " needs a value";
    } else if (dynamic_cast<const CLI::RequiredError *>(&e) != nullptr && group) {
        // A word that names no object or action is left over.
        std::vector<std::string> left = root->remaining(true);
        if (!left.empty())
            why = at->get_parent() == nullptr ? "unknown object '" + left.front() + "'"
                                              : "unknown action '" + at->get_name() + " " + left.front() + "'";
        else
            why = at->get_parent() == nullptr ? "give an OBJECT and its ACTION" : "give an ACTION of " + at->get_name();
    }
    fprintf(stderr, "orloiscsi: %s\n", why.c_str());
    if (group)
        fputs(HelpOf(at).c_str(), stderr);
    else
        fprintf(stderr, "%s\n", UsageLine(at).c_str());
    return kExitUsage;
}

}  // namespace

const Context &Ctx() { return gContext; }
Context &MutableCtx() { return gContext; }

CLI::App *AddObject(CLI::App *root, const char *name, const char *summary) {
    CLI::App *obj = root->add_subcommand(name, summary);
    obj->require_subcommand(1);
    Reg().summaries[obj] = summary;
    // "orloiscsi lun help" is "orloiscsi lun --help".
    AddHiddenAction(obj, "help", [obj] {
        fputs(HelpOf(obj).c_str(), stdout);
        return 0;
    });
    return obj;
}

CLI::App *AddAction(CLI::App *parent, const char *name, const char *summary, std::function<int()> run,
                    unsigned flags) {
    CLI::App *act = parent->add_subcommand(name, summary);
    Reg().summaries[act] = summary;
    ActionInfo &info = Reg().actions[act];
    info.run = std::move(run);
    info.flags = flags;
    return act;
}

CLI::App *AddHiddenAction(CLI::App *parent, const char *name, std::function<int()> run) {
    CLI::App *act = AddAction(parent, name, "", std::move(run), kLeavesRoot);
    act->group("");
    Reg().hidden.insert(act);
    return act;
}

CLI::Option *AddPositional(CLI::App *action, const char *placeholder, std::string *value, const char *description,
                           bool required) {
    CLI::Option *opt = action->add_option(PositionalName(placeholder), *value, description);
    Registry &r = Reg();
    r.placeholders[opt] = placeholder;
    auto slot = std::make_unique<Slot>();
    slot->opt = opt;
    slot->value = value;
    slot->required = required;
    r.slotOf[opt] = slot.get();
    r.actions[action].slots.push_back(std::move(slot));
    return opt;
}

CLI::Option *AddPositionals(CLI::App *action, const char *placeholder, std::vector<std::string> *values,
                            const char *description, bool required) {
    CLI::Option *opt = action->add_option(PositionalName(placeholder), *values, description);
    Reg().placeholders[opt] = placeholder;
    Reg().repeatable.insert(opt);
    ActionInfo &info = Reg().actions[action];
    info.rest = opt;
    info.restRequired = required;
    return opt;
}

CLI::Option *AddAlias(CLI::App *action, CLI::Option *slotOpt, const char *name, const char *placeholder,
                      const char *description) {
    Registry &r = Reg();
    Slot *slot = r.slotOf.at(slotOpt);
    CLI::Option *opt = action->add_option(name, slot->aliasValue, description);
    opt->type_name(placeholder);
    r.placeholders[opt] = placeholder;
    slot->alias = opt;
    r.slotOf[opt] = slot;
    return opt;
}

CLI::Option *AddValue(CLI::App *action, const char *name, const char *placeholder, std::string *value,
                      const char *description) {
    CLI::Option *opt = action->add_option(name, *value, description);
    opt->type_name(placeholder);
    Reg().placeholders[opt] = placeholder;
    return opt;
}

CLI::Option *AddValues(CLI::App *action, const char *name, const char *placeholder, std::vector<std::string> *values,
                       const char *description) {
    // One value per occurrence: "--portal A --portal B", never "--portal A B".
    CLI::Option *opt = action->add_option(name, *values, description)->allow_extra_args(false);
    opt->type_name(placeholder);
    Reg().placeholders[opt] = placeholder;
    Reg().repeatable.insert(opt);
    return opt;
}

CLI::Option *AddFlag(CLI::App *action, const char *name, bool *value, const char *description) {
    return action->add_flag(name, *value, description);
}

void OneOf(CLI::App *action, const std::vector<CLI::Option *> &members, bool required) {
    Group g;
    g.members = members;
    g.required = required;
    Reg().groups[action].push_back(std::move(g));
}

bool Parse(CLI::App *root, int argc, char **argv, Chosen *chosen, int *status) {
    try {
        root->parse(argc, argv);
    } catch (const CLI::CallForHelp &) {
        fputs(HelpOf(Deepest(root)).c_str(), stdout);
        *status = 0;
        return false;
    } catch (const CLI::CallForVersion &e) {
        printf("%s\n", e.what());
        *status = 0;
        return false;
    } catch (const CLI::ParseError &e) {
        *status = ReportParseError(root, e);
        return false;
    }
    const CLI::App *at = Deepest(root);
    auto it = Reg().actions.find(at);
    if (it == Reg().actions.end()) {  // an object without an action (caught above, kept for safety)
        fputs(HelpOf(at).c_str(), stderr);
        *status = kExitUsage;
        return false;
    }
    Reg().running = at;
    try {
        Resolve(at, &it->second);
    } catch (const UsageProblem &p) {
        *status = UsageError(p.why);
        return false;
    }
    chosen->run = it->second.run;
    chosen->flags = it->second.flags;
    return true;
}

std::string CurrentUsage() { return Reg().running != nullptr ? UsageLine(Reg().running) : std::string(); }

int UsageError(const std::string &why) {
    fprintf(stderr, "orloiscsi: %s\n%s\n", why.c_str(), CurrentUsage().c_str());
    return kExitUsage;
}

std::string HelpOf(const CLI::App *app) {
    std::string out = UsageLine(app) + "\n\n";
    if (app->get_parent() == nullptr) {
        out += app->get_description() + "\n\nOptions (before or after OBJECT ACTION):\n" + ArgumentList(app) +
               "\nObjects:\n";
    } else if (!IsAction(app)) {
        out += Summary(app) + "\n\nActions:\n";
    } else {
        out += Summary(app) + "\n";
        std::string args = ArgumentList(app);
        if (!args.empty()) out += "\n" + args;
        return out;
    }
    for (const CLI::App *sub : VisibleSubcommands(app)) {
        if (app->get_parent() == nullptr) {
            char line[256];
            snprintf(line, sizeof(line), "  %-12s %s\n", sub->get_name().c_str(), Summary(sub).c_str());
            out += line;
        } else {
            std::string args = RenderArguments(sub);
            out += "  " + sub->get_name() + (args.empty() ? "" : " " + args) + "\n      " + Summary(sub) + "\n";
        }
    }
    if (app->get_parent() == nullptr)
        out += "\n'orloiscsi OBJECT --help' lists an object's actions, 'orloiscsi OBJECT ACTION --help' tells more "
               "of one.\n";
    return out;
}

// One line per word that may follow: "+NAME" an object or action, "-OPTION" a switch,
// "-OPTION PLACEHOLDER" an option with its value, "@PLACEHOLDER" a positional (in order;
// "..." when it takes every remaining word).  An alias shows the placeholder of the
// positional it stands for, so that completion offers the same names for both.
std::string CompletionWords(CLI::App *root, const std::vector<std::string> &words) {
    const CLI::App *app = root;
    for (const std::string &w : words) {
        const CLI::App *next = nullptr;
        for (const CLI::App *sub : VisibleSubcommands(app))
            if (sub->get_name() == w) next = sub;
        if (next == nullptr) return std::string();
        app = next;
    }
    std::string out;
    for (const CLI::App *sub : VisibleSubcommands(app)) out += "+" + sub->get_name() + "\n";
    for (const CLI::Option *opt : app->get_options()) {
        if (opt->get_positional()) {
            out += "@" + Placeholder(opt) + (Reg().repeatable.count(opt) ? "..." : "") + "\n";
            continue;
        }
        std::string line = opt->get_name();
        if (IsHelpFlag(app, opt)) line = "--help";
        if (opt->get_expected_max() != 0) {
            auto s = Reg().slotOf.find(opt);
            line += " " + (s != Reg().slotOf.end() ? Placeholder(s->second->opt) : Placeholder(opt));
        }
        out += line + "\n";
    }
    return out;
}

}  // namespace cli
