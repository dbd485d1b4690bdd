// Inserting and removing the kernel target's module lists, one module file at a time.
// Callers hold the service lock.
#ifndef ORLO_SERVICE_KERNEL_MODULES_H
#define ORLO_SERVICE_KERNEL_MODULES_H

#include <stdint.h>

#include <string>
#include <vector>

namespace orlo {
namespace service {

// The module file of a name: "/lib/modules/<name>.ko".
std::string ModuleFile(const std::string &name);

// Inserts one module with /sbin/insmod when its file exists and it is not in already.
// 0, or 18990030 (logged).
uint32_t insmod_if_module_file_exist(const std::string &name);
// Inserts a list in order; the first failure ends it (logged with the module's name).
uint32_t insmod_module_set(const std::vector<std::string> &modules);

// Removes one module with the kernel's delete-module call (O_NONBLOCK) when its file
// exists.  0, or 18990031 (logged).
uint32_t rmmod_if_module_file_exist(const std::string &name);
// Removes a list last module first; the first failure ends the walk.
uint32_t rmmod_module_set(const std::vector<std::string> &modules);

// True for the set numbers 1..4; logs "invalid kernel module set" otherwise.
bool ModuleSetIsValid(int moduleSet);

// The module sets in the order a stop takes them out: fabrics before the core (1, 4, 2,
// 3), each with the name its log lines use.
struct ModuleUnloadStep {
    int set;
    const char *name;
};
extern const ModuleUnloadStep kModuleUnloadOrder[4];

// Whether any module of the set is in the kernel.  A set with none in (never loaded, as
// vhost and loopback often are, or taken out by an earlier stop) has nothing to remove;
// removing it would only report "not loaded" for its first module.  When the module
// table cannot be read the answer is yes, so the set is removed all the same.
bool ModuleSetHasModuleIn(int moduleSet);

}  // namespace service
}  // namespace orlo

#endif
