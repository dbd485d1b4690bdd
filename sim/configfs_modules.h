/*
 * The simulated kernel modules: which trees of the configfs model each one brings when
 * it is inserted and takes away when it is removed, what it needs inserted first, and
 * when it is in use.  Names and sets are those the service inserts for the two target
 * generations.
 */
#ifndef ORLO_SIM_CONFIGFS_MODULES_H
#define ORLO_SIM_CONFIGFS_MODULES_H

#include <string>
#include <vector>

namespace orlosim {

class Sim;

struct ModuleDef {
    const char *name;
    // Modules that must be inserted first; "a|b" is satisfied by either.
    std::vector<std::string> deps;
    // Directories the kernel makes at insertion (tree path, kind), parents first.
    std::vector<std::pair<std::string, std::string>> nodes;
    // The fabric directory under /target this module serves (mkdir allowed while in).
    const char *fabric;
    // Backstore plugins it carries: hosts "<backend>_<n>" may be made under core.
    std::vector<std::string> backends;
};

const std::vector<ModuleDef> &ModuleTable();
const ModuleDef *FindModule(const std::string &name);

bool FabricAvailable(const Sim &sim, const std::string &fabric);
bool BackendAvailable(const Sim &sim, const std::string &backend);

}  // namespace orlosim

#endif
