// Creates a LUN from a filled record: checks the request, then, under the creation lock
// (one creation at a time on the appliance), checks the LUN count, the name and the
// space, gives the LUN its lid, uuid and serial, makes its directory and backing object
// while holding the LUN's own lock, lets plug-ins veto and hear of it, and writes its
// sections.  A creation that fails leaves nothing of itself behind: no section, no
// directory, data file, map file or extent pool that it made, only an event-log entry.
#include <linux/btrfs.h>
#include <fcntl.h>
#include <sys/ioctl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cctype>
#include <cerrno>
#include <cstdio>
#include <cstring>
#include <optional>
#include <string>
#include <vector>

#include "base/iscsi_base_internal.h"
#include "ep_internal.h"
#include "lun/lun_create_internal.h"
#include "lun/lun_internal.h"
#include "orlo_storage.h"
#include "orloiscsi_ep.h"
#include "orloiscsi_file.h"
#include "platform/os_seam.h"

namespace {

using namespace orlo::lun;

constexpr size_t kPathSize = 4096;

bool PathExists(const char *path) {
    struct stat st;
    return orlo::os::Lstat(path, &st) == 0;
}

// ---- The request, checked before anything is made ----

// Why a name cannot be a LUN's name, or NULL.  Names are section values and appear in
// plug-in JSON, log lines and the event log: one line, read back exactly as written.
const char *NameFault(const ORLOiSCSILun *lun) {
    const size_t n = strnlen(lun->name, sizeof(lun->name));
    if (n == 0) return "empty";
    if (n == sizeof(lun->name)) return "longer than 255 characters";
    for (size_t i = 0; i < n; ++i) {
        const unsigned char c = static_cast<unsigned char>(lun->name[i]);
        if (c < 0x20 || c == 0x7F) return "control character";
    }
    if (strchr(lun->name, ']') != nullptr) return "holds \"]\"";
    if (!orlo::IsUtf8(lun->name, n)) return "not UTF-8";
    if (lun->name[0] == ' ' || lun->name[0] == '\t') return "leading blank";
    if (n >= 2 && lun->name[0] == '"' && lun->name[n - 1] == '"') return "enclosed in double quotes";
    return nullptr;
}

// "xxxxxxxx-xxxx-xxxx-xxxx-xxxxxxxxxxxx" in hexadecimal digits.
bool IsUuidForm(const char *s, size_t size) {
    if (strnlen(s, size) != ORLO_ISCSI_UUID_LEN) return false;
    for (size_t i = 0; i < ORLO_ISCSI_UUID_LEN; ++i) {
        const bool dash = i == 8 || i == 13 || i == 18 || i == 23;
        if (dash ? s[i] != '-' : !isxdigit(static_cast<unsigned char>(s[i]))) return false;
    }
    return true;
}

// A file LUN's root path must be a mounted volume "/volume<N>" itself.
uint32_t CheckVolume(const ORLOiSCSILun *lun) {
    int number = -1, consumed = 0;
    const char *root = lun->rootPath;
    // Digits only, no leading zero: the one spelling of the volume's path.
    if (strncmp(root, "/volume", 7) != 0 || !isdigit(static_cast<unsigned char>(root[7])) || root[7] == '0' ||
        sscanf(root, "/volume%d%n", &number, &consumed) != 1 || root[consumed] != '\0' ||
        ORLOVolIDParse(root) != number) {
        ORLO_LOG_ERR("Bad LUN location: \"%s\" is not a volume", root);
        return kErrBadLocation;
    }
    ORLO_SPACE_INFO info;
    if (ORLOSpaceInfoGet(root, &info) < 1 || strcmp(info.szMountPoint, root) != 0) {
        ORLO_LOG_ERR("Bad LUN location: no volume is mounted at %s", root);
        return kErrBadLocation;
    }
    return ORLO_OK;
}

uint32_t CheckBlockDevice(const ORLOiSCSILun *lun) {
    ORLO_SPACE_INFO info;
    if (strncmp(lun->rootPath, "/dev/", 5) != 0 || ORLOSpaceInfoGet(lun->rootPath, &info) < 1 ||
        info.isBlockDevice != 1) {
        ORLO_LOG_ERR("lid:%d name:%s szRootPath:%s IBLOCK: Please reference a valid /dev/ block_device", lun->lid,
                     lun->name, lun->rootPath);
        return kErrBadLocation;
    }
    return ORLO_OK;
}

uint32_t CheckRequest(const ORLOiSCSILun *lun) {
    if (const char *fault = NameFault(lun)) {
        ORLO_LOG_ERR("Bad LUN name: %s", fault);
        return kErrBadName;
    }
    if (TypeFind(lun->type) == nullptr) {
        ORLO_LOG_ERR("Unknown lun type: %d (%s). name: %s", static_cast<int>(lun->type),
                     ORLOiSCSILunTypeName(lun->type), lun->name);
        return kErrBadLunType;
    }
    if (lun->blockSize != 512 && lun->blockSize != 4096) {
        ORLO_LOG_ERR("Bad LUN block size: %u. name: %s", lun->blockSize, lun->name);
        return ORLO_ERR_BAD_PARAMETER;
    }
    if (lun->size == 0 || lun->size % lun->blockSize != 0 || lun->size > static_cast<uint64_t>(INT64_MAX)) {
        ORLO_LOG_ERR("Bad LUN size: %llu (block size %u). name: %s", static_cast<unsigned long long>(lun->size),
                     lun->blockSize, lun->name);
        return kErrBadSize;
    }
    if (lun->lid != 0 && (lun->lid < ORLO_ISCSI_LID_MIN || lun->lid > ORLO_ISCSI_LID_MAX)) {
        ORLO_LOG_ERR("Bad LUN ID: %d. name: %s", lun->lid, lun->name);
        return kErrBadLid;
    }
    if (lun->uuid[0] != '\0' && !IsUuidForm(lun->uuid, sizeof(lun->uuid))) {
        ORLO_LOG_ERR("Bad LUN UUID: not a UUID string. name: %s", lun->name);
        return kErrBadUuid;
    }
    const size_t serialLen = strnlen(lun->vpdUnitSerial, sizeof(lun->vpdUnitSerial));
    bool serialOk = serialLen < sizeof(lun->vpdUnitSerial) && lun->vpdUnitSerial[0] != ' ';
    for (size_t i = 0; serialOk && i < serialLen; ++i)
        serialOk = isprint(static_cast<unsigned char>(lun->vpdUnitSerial[i])) != 0 && lun->vpdUnitSerial[i] != ']';
    if (!serialOk) {
        ORLO_LOG_ERR("Bad LUN vpd_unit_serial. name: %s", lun->name);
        return ORLO_ERR_BAD_PARAMETER;
    }
    if (ORLO_ISCSI_LUN_IS_ADV(lun->type) && lun->extentSize != 0 &&
        (lun->extentSize < EP_EXTENT_SIZE_MIN || lun->extentSize > EP_EXTENT_SIZE_MAX ||
         (lun->extentSize & (lun->extentSize - 1)) != 0)) {
        ORLO_LOG_ERR("Bad LUN extent_size: %u. name: %s", lun->extentSize, lun->name);
        return kErrBadExtentSize;
    }
    if (strnlen(lun->rootPath, sizeof(lun->rootPath)) == sizeof(lun->rootPath)) {
        ORLO_LOG_ERR("Bad LUN location: root path longer than %zu characters", sizeof(lun->rootPath) - 1);
        return kErrBadLocation;
    }
    return ORLO_ISCSI_LUN_IS_FILE_BACKED(lun->type) ? CheckVolume(lun) : CheckBlockDevice(lun);
}

// ---- The creation itself ----

class Creation {
  public:
    explicit Creation(ORLOiSCSILun *lun)
        : lun_(lun), fileBacked_(ORLO_ISCSI_LUN_IS_FILE_BACKED(lun->type)), presetUuid_(lun->uuid[0] != '\0') {}
    Creation(const Creation &) = delete;
    Creation &operator=(const Creation &) = delete;

    // Every step up to the sections; the first failure's code.
    uint32_t Run();
    // After a failure: the event-log entry, then everything this call made, removed.
    void Undo();
    // Always: the plug-ins' post-step, the LUN's lock and the creation lock released.
    void Finish(uint32_t result);

  private:
    uint32_t Identify();
    uint32_t MakeDirectory();
    uint32_t MakePool();
    uint32_t RunPluginsPre();
    uint32_t MakeObject();
    void SyncBtrfs();
    uint32_t WriteSections();
    void RemoveSections();
    void RemovePool();

    ORLOiSCSILun *lun_;
    const bool fileBacked_;
    const bool presetUuid_;
    std::optional<orlo::FileLockGuard> creationLock_;
    bool lunLocked_ = false;
    POLIB_PLUGIN plugin_ = nullptr;

    // What this call made, so that a failure can take it away again.
    std::vector<std::string> madeDirs_;  // in the order made
    bool madePool_ = false;
    std::string madeDataFile_;
    bool sectionsTried_ = false;
    bool pendingRecorded_ = false;
    bool volumeHadSection_ = false;
    bool volumeConfExisted_ = true;
};

uint32_t Creation::Run() {
    // The volume's @iSCSI tree and the runtime directories the locks live in (a BLOCK LUN
    // has no volume: only the latter).
    const char *volume = fileBacked_ ? lun_->rootPath : nullptr;
    uint32_t ret = ORLOiSCSIBaseMkdir(volume);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIBaseMkdir(\"%s\") failed, err=%s", volume != nullptr ? volume : "(null)",
                     ORLOiSCSIErrStr(ret));
        return ret;
    }
    creationLock_.emplace(kCreationLockPath, true, kCreationLockTimeoutSec);
    if (!creationLock_->held()) {
        ORLO_LOG_LOCK_FAILED(kCreationLockPath);
        return ORLO_ERR_LOCK_FILE;
    }
    // Whatever a killed creation or deletion left half-done is settled first, so that
    // the count, the names and the lids below are those of finished LUNs.
    RecoverPending(true);
    ret = Identify();
    if (ret != ORLO_OK) return ret;
    // From here on this creation makes things: recorded first, so that a process killed
    // before its sections are written is rolled back by the next creation, deletion or
    // service start.
    ret = RecordPending(lun_, "create");
    if (ret != ORLO_OK) return ret;
    pendingRecorded_ = true;
    if (fileBacked_) {
        ret = MakeDirectory();
        if (ret != ORLO_OK) return ret;
        if (ORLO_ISCSI_LUN_IS_ADV(lun_->type)) {
            ret = MakePool();
            if (ret != ORLO_OK) return ret;
        }
    }
    ret = ORLOiSCSILunLock(lun_, ORLO_ISCSI_LUN_STEP_CREATE);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("Failed to lock LUN. UUID: %s, name: %s", lun_->uuid, lun_->name);
        return ret;
    }
    lunLocked_ = true;
    ret = RunPluginsPre();
    if (ret != ORLO_OK) return ret;
    ret = MakeObject();
    if (ret != ORLO_OK) return ret;
    if (fileBacked_) SyncBtrfs();
    ret = WriteSections();
    if (ret != ORLO_OK) return ret;
    if (ORLORAIDStripeCacheTune(lun_->rootPath) != 0) {
        int err = OLIBCErrGet();
        const char *errFile = OLIBCErrorGetFile();
        int errLine = OLIBCErrorGetLine();
        ORLO_LOG_ERR("Failed to tune RAID stripe cache size[0x%04X %s:%d]", err, errFile, errLine);
    }
    return ORLO_OK;
}

// The count limit, the name, the space, and the LUN's lid, uuid and serial: all from one
// reading of the LUN file, taken under the creation lock so that it stays true.
uint32_t Creation::Identify() {
    std::vector<LunIdentity> all;
    uint32_t ret = LoadIdentities(&all);
    if (ret != ORLO_OK) return ret;

    const int limit = QuantityLimit();
    if (all.size() >= static_cast<size_t>(limit)) {
        ORLO_LOG_ERR("Reach max LUN count: %zu LUNs, limit %d. name: %s", all.size(), limit, lun_->name);
        return kErrMaxLunCount;
    }
    if (NameIn(all, lun_->name)) {
        ORLO_LOG_ERR("Duplicated LUN name: %s", lun_->name);
        return kErrDuplicatedName;
    }
    if (lun_->type != ORLO_ISCSI_LUN_TYPE_BLOCK) {
        ret = ORLOiSCSILunIsSpaceEnoughToCreate(lun_);
        if (ret != ORLO_OK) return ret;
    }
    if (lun_->lid == 0) {
        lun_->lid = UnusedLidIn(all);
        if (lun_->lid < 0) {
            lun_->lid = 0;
            ORLO_LOG_ERR("Failed to get unused lid");
            return kErrUnusedLid;
        }
    }
    if (presetUuid_) {
        // A uuid names the LUN's sections, directory and lock: two LUNs cannot share one.
        if (UuidIn(all, lun_->uuid)) {
            ORLO_LOG_ERR("Duplicated LUN UUID: %s", lun_->uuid);
            return kErrBadUuid;
        }
    } else {
        ret = UuidGenerateAvoiding(all, lun_->uuid);
        if (ret != ORLO_OK) return ret;
    }
    if (lun_->vpdUnitSerial[0] == '\0') snprintf(lun_->vpdUnitSerial, sizeof(lun_->vpdUnitSerial), "%s", lun_->uuid);
    lun_->restoredTime = 0;
    if (!ORLO_ISCSI_LUN_IS_ADV(lun_->type)) lun_->extentSize = 0;
    ORLO_LOG_WEBAPI_DEBUG("LUN UUID: %s ,LUN ID: %d", lun_->uuid, lun_->lid);
    return ORLO_OK;
}

uint32_t Creation::MakeDirectory() {
    // The directories ORLOiSCSILunMkdir may make, parents first; those missing now are
    // this call's.
    char lunDir[kPathSize];
    uint32_t ret = ORLOiSCSILunDirPathGet(lun_, lunDir, sizeof(lunDir));
    if (ret != ORLO_OK) return ret;
    std::vector<std::string> candidates;
    if ((lun_->stateFlags & ORLO_ISCSI_LUN_STATE_TMP) == 0) {
        candidates.push_back(std::string(lun_->rootPath) + "/@iSCSI/LUN");
        candidates.push_back(std::string(lun_->rootPath) + "/@iSCSI/LUN/" + ORLOiSCSILunTypeName(lun_->type));
    }
    candidates.push_back(lunDir);
    std::vector<std::string> missing;
    for (const std::string &dir : candidates)
        if (!PathExists(dir.c_str())) missing.push_back(dir);

    ret = ORLOiSCSILunMkdir(lun_);
    for (const std::string &dir : missing)
        if (PathExists(dir.c_str())) madeDirs_.push_back(dir);
    if (ret != ORLO_OK) ORLO_LOG_ERR("ORLOiSCSITrgMkdir(%p) failed, err=%s", static_cast<void *>(lun_), ORLOiSCSIErrStr(ret));
    return ret;
}

uint32_t Creation::MakePool() {
    char poolDir[EP_PATH_SIZE];
    uint32_t ret = orlo::ep::PoolDirPath(lun_->rootPath, poolDir, sizeof(poolDir));
    if (ret != ORLO_OK) return ret;
    const bool poolExisted = PathExists(poolDir);
    ret = ORLOiSCSIEpMetaFilesCreate(lun_->rootPath, lun_->extentSize);
    madePool_ = !poolExisted && PathExists(poolDir);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIEpMetaFilesCreate(\"%s\", %u) failed, err=%s", lun_->rootPath, lun_->extentSize,
                     ORLOiSCSIErrStr(ret));
    }
    return ret;
}

uint32_t Creation::RunPluginsPre() {
    if (OLIBPluginSDKInit(kPluginCategory, kPluginAction, &plugin_) != 0 || !OLIBPluginHasInit(plugin_)) {
        ORLO_LOG_ERR("OLIBPluginSDKInit failed");
        plugin_ = nullptr;
        return kErrPluginInit;
    }
    const std::string json = PluginJson(lun_, false, 0);
    if (json.empty() || OLIBPluginRun(plugin_, OLIB_PLUGIN_EVENT_PRE, json.c_str()) != 0) {
        ORLO_LOG_ERR("Failed to execute lun_create plugin (PRE). UUID: %s, name: %s", lun_->uuid, lun_->name);
        return kErrPluginRun;
    }
    return ORLO_OK;
}

uint32_t Creation::MakeObject() {
    if (fileBacked_) {
        char dataPath[kPathSize];
        uint32_t ret = ORLOiSCSILunDataPathGet(lun_, 0, dataPath, sizeof(dataPath));
        if (ret != ORLO_OK) return ret;
        if (!PathExists(dataPath)) madeDataFile_ = dataPath;
    }
    uint32_t ret = ORLOiSCSILunObjectCreate(lun_);
    if (ret != ORLO_OK)
        ORLO_LOG_ERR("ORLOiSCSILunObjectCreate(%p) failed, err=%s", static_cast<void *>(lun_), ORLOiSCSIErrStr(ret));
    return ret;
}

// Puts what was made on disk before the sections say the LUN exists.
void Creation::SyncBtrfs() {
    if (ORLOGetFSType(lun_->rootPath) != ORLO_FSTYPE_BTRFS) return;
    int fd = orlo::os::Open(lun_->rootPath, O_RDONLY | O_DIRECTORY | O_CLOEXEC);
    if (fd < 0) {
        ORLO_LOG_ERR("open(\"%s\", O_RDONLY | O_DIRECTORY) failed, err=%m", lun_->rootPath);
        return;
    }
    orlo::FdGuard guard(fd);
    if (ioctl(fd, BTRFS_IOC_SYNC, nullptr) != 0) ORLO_LOG_ERR("ioctl(%d, BTRFS_IOC_SYNC) failed, err=%m", fd);
}

uint32_t Creation::WriteSections() {
    if (fileBacked_) {
        char volumeConf[kConfPathSize];
        uint32_t ret = VolumeConfPath(lun_->rootPath, volumeConf, sizeof(volumeConf));
        if (ret != ORLO_OK) return ret;
        volumeConfExisted_ = PathExists(volumeConf);
        // A LUN brought back with its own uuid may have its section in the volume's copy
        // already: that one stays, whatever happens here.
        if (presetUuid_ && volumeConfExisted_) {
            ORLOiSCSILun stored;
            volumeHadSection_ = ORLOiSCSILunConfInVolumeLoadByUuid(lun_->rootPath, lun_->uuid, &stored) == ORLO_OK;
        }
    }
    sectionsTried_ = true;
    uint32_t ret = ORLOiSCSILunConfSet(lun_);
    if (ret != ORLO_OK)
        ORLO_LOG_ERR("ORLOiSCSILunConfSet(%p) failed, err=%s", static_cast<void *>(lun_), ORLOiSCSIErrStr(ret));
    return ret;
}

void Creation::RemoveSections() {
    orlo::FileLockGuard lock(kConfLockPath, true, kConfLockTimeoutSec);
    if (!lock.held()) {
        ORLO_LOG_LOCK_FAILED(kConfLockPath);
        return;
    }
    // The uuid was checked to be new in the global file: its section there is ours.
    ORLOiSCSILunConfRemoveSection(lun_, kGlobalConfPath);
    if (!fileBacked_ || volumeHadSection_) return;
    char volumeConf[kConfPathSize];
    if (VolumeConfPath(lun_->rootPath, volumeConf, sizeof(volumeConf)) != ORLO_OK) return;
    if (!volumeConfExisted_) {
        if (orlo::os::Unlink(volumeConf) != 0 && errno != ENOENT)
            ORLO_LOG_ERR("unlink(\"%s\") failed, err=%m", volumeConf);
        return;
    }
    ORLOiSCSILunConfRemoveSection(lun_, volumeConf);
}

void Creation::RemovePool() {
    const int volumeNumber = ORLOVolIDParse(lun_->rootPath);
    int32_t lockFd = -1;
    uint32_t ret = ORLOiSCSIEpLock(&lockFd, volumeNumber);
    if (ret != ORLO_OK) {
        ORLO_LOG_ERR("ORLOiSCSIEpLock(%p, %d) failed, err=%s", static_cast<void *>(&lockFd), volumeNumber,
                     ORLOiSCSIErrStr(ret));
        return;
    }
    uint32_t (*const builders[])(const char *, char *, size_t) = {orlo::ep::DatPath, orlo::ep::FriPath,
                                                                  orlo::ep::TblPath};
    for (auto build : builders) {
        char path[EP_PATH_SIZE];
        if (build(lun_->rootPath, path, sizeof(path)) != ORLO_OK) continue;
        if (orlo::os::Unlink(path) != 0 && errno != ENOENT)
            ORLO_LOG_ERR("unlink(\"%s\") failed, err=%m", path);
    }
    char poolDir[EP_PATH_SIZE];
    if (orlo::ep::PoolDirPath(lun_->rootPath, poolDir, sizeof(poolDir)) == ORLO_OK && orlo::os::Rmdir(poolDir) != 0 &&
        errno != ENOENT)
        ORLO_LOG_ERR("rmdir(\"%s\") failed, err=%m", poolDir);
    ret = ORLOiSCSIEpUnlock(lockFd);
    if (ret != ORLO_OK) ORLO_LOG_ERR("ORLOiSCSIEpUnlock(%d) failed, err=%s", lockFd, ORLOiSCSIErrStr(ret));
}

void Creation::Undo() {
    if (ORLOLogSet1(kEventCreateFailed, lun_->name, ORLOiSCSILunTypeName(lun_->type), lun_->rootPath) != 0)
        ORLO_LOG_PLATFORM("ORLOLogSet1(0x%08X, \"%s\", \"%s\", \"%s\")", kEventCreateFailed, lun_->name,
                          ORLOiSCSILunTypeName(lun_->type), lun_->rootPath);
    if (sectionsTried_) RemoveSections();
    if (!madeDataFile_.empty() && orlo::os::Unlink(madeDataFile_.c_str()) != 0 && errno != ENOENT)
        ORLO_LOG_ERR("unlink(\"%s\") failed, err=%m", madeDataFile_.c_str());
    // Deepest first: the LUN's directory (a subvolume goes with what is in it), then the
    // parents this call made, when nothing else has moved into them.
    for (auto it = madeDirs_.rbegin(); it != madeDirs_.rend(); ++it) {
        if (it == madeDirs_.rbegin()) {
            ORLOiSCSIRmdir(it->c_str());
        } else if (orlo::os::Rmdir(it->c_str()) != 0 && errno != ENOENT && errno != ENOTEMPTY && errno != EEXIST) {
            ORLO_LOG_ERR("rmdir(\"%s\") failed, err=%m", it->c_str());
        }
    }
    if (madePool_) RemovePool();
}

void Creation::Finish(uint32_t result) {
    if (plugin_ != nullptr) {
        const std::string json = PluginJson(lun_, true, result);
        if (json.empty() || OLIBPluginRun(plugin_, OLIB_PLUGIN_EVENT_POST, json.c_str()) != 0)
            ORLO_LOG_ERR("Failed to execute lun_create plugin (POST). lid: %d, lun_name: %s", lun_->lid, lun_->name);
        OLIBPluginExit(plugin_);
        plugin_ = nullptr;
    }
    // Done either way: finished, or undone above.
    if (pendingRecorded_) ClearPending(lun_->uuid);
    // The zero filling's progress ends with the creation.
    char progress[64];
    snprintf(progress, sizeof(progress), ORLO_ISCSI_FILE_PROGRESS_PATH_FMT, static_cast<int>(getpid()));
    if (orlo::os::Unlink(progress) != 0 && errno != ENOENT && errno != ENOTDIR)
        ORLO_LOG_ERR("unlink(\"%s\") failed, err=%m", progress);
    if (lunLocked_) {
        if (ORLOiSCSILunUnlock(lun_) != ORLO_OK)
            ORLO_LOG_ERR("Failed to unlock LUN. lid: %d, name: %s", lun_->lid, lun_->name);
        lunLocked_ = false;
    }
    creationLock_.reset();
}

}  // namespace

extern "C" ORLO_EXPORT uint32_t ORLOiSCSILunCreate(ORLOiSCSILun *lun) {
    if (lun == nullptr) {
        ORLO_LOG_BAD_PARAMS();
        return ORLO_ERR_NULL_POINTER;
    }
    uint32_t ret = CheckRequest(lun);
    if (ret != ORLO_OK) return ret;
    lun->lockHandle = -1;
    Creation creation(lun);
    ret = creation.Run();
    if (ret != ORLO_OK) creation.Undo();
    creation.Finish(ret);
    return ret;
}
