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

}  // namespace service
}  // namespace orlo

#endif
