#include "configfs_modules.h"

#include <cerrno>

#include "configfs_sim.h"

namespace orlosim {

const std::vector<ModuleDef> &ModuleTable() {
    static const std::vector<ModuleDef> table = {
        // The newer target generation: core and one module per backstore plugin.
        {"rodsp_ep", {}, {}, nullptr, {}},
        {"orlo_extent_pool", {"rodsp_ep"}, {{"/pool", "pool"}}, nullptr, {}},
        {"target_core_mod", {}, {{"/target", "target"}, {"/target/core", "core"}, {"/vsys", "vsys"}}, nullptr, {}},
        {"target_core_iblock", {"target_core_mod"}, {{"/target/core/iblock_0", "host_iblock"}}, nullptr, {"iblock"}},
        {"target_core_file",
         {"target_core_mod"},
         {{"/target/core/fileio_0", "host_fileio"}, {"/target/core/fileio_1", "host_fileio"}},
         nullptr,
         {"fileio"}},
        {"target_core_ep",
         {"target_core_mod", "orlo_extent_pool"},
         {{"/target/core/epio_0", "host_epio"}, {"/target/core/epio_1", "host_epio"}},
         nullptr,
         {"epio"}},
        {"iscsi_target_mod", {"target_core_mod"}, {}, "iscsi", {}},
        {"ib_isert", {"iscsi_target_mod"}, {}, nullptr, {}},
        // The older generation: one core module with the block and file plugins built in.
        {"rodsp_ep_4_0", {}, {}, nullptr, {}},
        {"target_core_mod_4_0",
         {"rodsp_ep_4_0"},
         {{"/target", "target"},
          {"/target/core", "core"},
          {"/vsys", "vsys"},
          {"/target/core/iblock_0", "host_iblock"},
          {"/target/core/fileio_0", "host_fileio"},
          {"/target/core/fileio_1", "host_fileio"}},
         nullptr,
         {"iblock", "fileio"}},
        {"iscsi_extent_pool", {"target_core_mod_4_0"}, {{"/pool", "pool"}}, nullptr, {}},
        {"iscsi_target_mod_4_0", {"target_core_mod_4_0"}, {}, "iscsi", {}},
        // Fabrics shared by both generations.
        {"vhost_scsi", {"target_core_mod|target_core_mod_4_0"}, {}, "vhost", {}},
        {"tcm_loop", {"target_core_mod|target_core_mod_4_0"}, {}, "loopback", {}},
    };
    return table;
}

const ModuleDef *FindModule(const std::string &name) {
    for (const ModuleDef &m : ModuleTable())
        if (name == m.name) return &m;
    return nullptr;
}

bool FabricAvailable(const Sim &sim, const std::string &fabric) {
    for (const ModuleDef &m : ModuleTable())
        if (m.fabric != nullptr && fabric == m.fabric && sim.ModuleInserted(m.name)) return true;
    return false;
}

bool BackendAvailable(const Sim &sim, const std::string &backend) {
    for (const ModuleDef &m : ModuleTable())
        for (const std::string &b : m.backends)
            if (b == backend && sim.ModuleInserted(m.name)) return true;
    return false;
}

namespace {

bool DepSatisfied(const Sim &sim, const std::string &dep) {
    size_t start = 0;
    while (true) {
        size_t bar = dep.find('|', start);
        if (sim.ModuleInserted(dep.substr(start, bar == std::string::npos ? std::string::npos : bar - start)))
            return true;
        if (bar == std::string::npos) return false;
        start = bar + 1;
    }
}

bool DependsOn(const ModuleDef &m, const std::string &name) {
    for (const std::string &dep : m.deps) {
        size_t start = 0;
        while (true) {
            size_t bar = dep.find('|', start);
            if (dep.substr(start, bar == std::string::npos ? std::string::npos : bar - start) == name) return true;
            if (bar == std::string::npos) break;
            start = bar + 1;
        }
    }
    return false;
}

}  // namespace

// Insertion: EEXIST when in already, ENOEXEC for a file that is no module we know (as
// for a module exporting symbols another one already exports), ENOENT when a module it
// needs is missing (the kernel's "Unknown symbol in module").
int Sim::InsertModuleLocked(const std::string &name) {
    if (ModuleInserted(name)) return -EEXIST;
    const ModuleDef *m = FindModule(name);
    if (m == nullptr) return -ENOEXEC;
    for (const std::string &dep : m->deps)
        if (!DepSatisfied(*this, dep)) return -ENOENT;
    for (const auto &n : m->nodes)
        if (Find(n.first) != nullptr) return -ENOEXEC;
    for (const auto &n : m->nodes) {
        size_t slash = n.first.rfind('/');
        Node *parent = Find(slash == 0 ? "/" : n.first.substr(0, slash));
        if (parent == nullptr) return -ENOENT;
        MakeNode(parent, n.first.substr(slash + 1), KindByName(n.second), false);
    }
    modules_.push_back(name);
    return 0;
}

// Removal with O_NONBLOCK, as the delete-module call answers it: ENOENT when not
// inserted; EWOULDBLOCK while another inserted module depends on it, while a tree it
// brought holds anything a user made (backstores in its hosts, pools, vsys entries),
// or while its fabric directory holds target nodes.
int Sim::RemoveModuleLocked(const std::string &name) {
    if (!ModuleInserted(name)) return -ENOENT;
    const ModuleDef *m = FindModule(name);
    for (const std::string &other : modules_) {
        const ModuleDef *o = FindModule(other);
        if (o != nullptr && DependsOn(*o, name)) return -EWOULDBLOCK;
    }
    if (m != nullptr) {
        for (const auto &n : m->nodes) {
            Node *node = Find(n.first);
            if (node != nullptr && HoldsUserContent(node)) return -EWOULDBLOCK;
        }
        Node *fabric = m->fabric != nullptr ? Find(std::string("/target/") + m->fabric) : nullptr;
        if (fabric != nullptr && HoldsUserContent(fabric)) return -EWOULDBLOCK;
        if (fabric != nullptr) {
            Invalidate(fabric);
            DestroyNode(fabric);
        }
        for (auto it = m->nodes.rbegin(); it != m->nodes.rend(); ++it) {
            Node *node = Find(it->first);
            if (node == nullptr) continue;
            Invalidate(node);
            DestroyNode(node);
        }
    }
    for (auto it = modules_.begin(); it != modules_.end(); ++it)
        if (*it == name) {
            modules_.erase(it);
            break;
        }
    return 0;
}

bool Sim::ModuleInserted(const std::string &name) const {
    for (const std::string &m : modules_)
        if (m == name) return true;
    return false;
}

int Sim::InsertModule(const std::string &name) {
    std::lock_guard<std::mutex> lock(mu_);
    return InsertModuleLocked(name);
}

int Sim::RemoveModule(const std::string &name) {
    std::lock_guard<std::mutex> lock(mu_);
    return RemoveModuleLocked(name);
}

std::vector<std::string> Sim::Modules() {
    std::lock_guard<std::mutex> lock(mu_);
    return modules_;
}

}  // namespace orlosim
