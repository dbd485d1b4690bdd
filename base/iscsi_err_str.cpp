// Decoding of result codes into their messages.
//
// Library codes come in blocks of consecutive numbers; each block has one array of
// messages indexed by (code - base).  Any other code is an errno value, positive or
// negated.
#include "base/iscsi_base_internal.h"

#include <cstring>

namespace {

// 18990000-18990061: General
const char *const kGeneralMessages[] = {
    "Default error code",  // 18990000
    "Out of memory",  // 18990001
    "Out of free space",  // 18990002
    "Null pointer",  // 18990003
    "Bad parameter",  // 18990004
    "Bad file system type",  // 18990005
    "Bad file type",  // 18990006
    "Bad file size",  // 18990007
    "Bad string length",  // 18990008
    "No permission",  // 18990009
    "Timeout",  // 18990010
    "File not found",  // 18990011
    "File exists",  // 18990012
    "Try again",  // 18990013
    "Failed to fork",  // 18990014
    "Failed to lock file",  // 18990015
    "Failed to unlock file",  // 18990016
    "Failed to get file session",  // 18990017
    "Failed to set file session",  // 18990018
    "Failed to add file session",  // 18990019
    "Failed to remove file session",  // 18990020
    "Failed to stat path",  // 18990021
    "Failed to access path",  // 18990022
    "Failed to touch file",  // 18990023
    "Failed to flush or close file",  // 18990024
    "Failed to copy string",  // 18990025
    "Failed to open directory",  // 18990026
    "Failed to close directory",  // 18990027
    "Failed to cerate directory",  // 18990028
    "Failed to remove directory",  // 18990029
    "Failed to insmod kernel module",  // 18990030
    "Failed to rmmod kernel module",  // 18990031
    "Failed to set hash value",  // 18990032
    "Failed to get hash value",  // 18990033
    "Failed to set pairs",  // 18990034
    "Failed to get pairs",  // 18990035
    "Failed to link file",  // 18990036
    "Failed to unlink file",  // 18990037
    "Failed to open file",  // 18990038
    "Failed to read file",  // 18990039
    "Failed to write file",  // 18990040
    "Failed to seek file",  // 18990041
    "Failed to rename file",  // 18990042
    "Failed to copy file",  // 18990043
    "Failed to glob",  // 18990044
    "Failed to start service",  // 18990045
    "Failed to stop service",  // 18990046
    "Failed to get file path",  // 18990047
    "Failed to allocate file",  // 18990048
    "Failed to get time",  // 18990049
    "Failed to parse string",  // 18990050
    "Failed to get hostent",  // 18990051
    "Failed to get filesystem info",  // 18990052
    "Failed to pin volume",  // 18990053
    "Failed to mount",  // 18990054
    "Failed to get hostname",  // 18990055
    "Failed to get truncate mode",  // 18990056
    "Failed to truncate file",  // 18990057
    "Directory exists",  // 18990058
    "Failed to enumerate directory",  // 18990059
    "Failed to rename directory",  // 18990060
    "Failed to kill process",  // 18990061
};

// 18990200-18990213: Web API and remote client
const char *const kWebApiMessages[] = {
    "No such API",  // 18990200
    "Invalid input",  // 18990201
    "Bad client input",  // 18990202
    "Bad IP",  // 18990203
    "Bad response",  // 18990204
    "Failed to login",  // 18990205
    "Failed to logout",  // 18990206
    "Failed to create request",  // 18990207
    "Failed to convert to json",  // 18990208
    "Failed to get uuid",  // 18990209
    "Failed to get session ID",  // 18990210
    "Failed to send the request",  // 18990211
    "Failed to get error code",  // 18990212
    "Not implemented yet",  // 18990213
};

// 18990300-18990321: Configuration files and volumes
const char *const kConfigFilesMessages[] = {
    "Failed to get volume info",  // 18990300
    "Failed to enumerate section",  // 18990301
    "Failed to enumerate config section",  // 18990302
    "Failed to get section",  // 18990303
    "Failed to add section",  // 18990304
    "Failed to set section",  // 18990305
    "Failed to remove section",  // 18990306
    "Failed to modify section",  // 18990307
    "Failed to push to list",  // 18990308
    "Failed to get from list",  // 18990309
    "Failed to parse header",  // 18990310
    "Failed to parse volume ID",  // 18990311
    "Failed to init plugin hook",  // 18990312
    "Failed to run plugin action",  // 18990313
    "Failed to get serial number",  // 18990314
    "Failed to send notification",  // 18990315
    "Failed to get space device size",  // 18990316
    "Failed to create Btrfs subvolume",  // 18990317
    "Failed to delete Btrfs subvolume",  // 18990318
    "Failed to get network interface",  // 18990319
    "Failed to get NIC PCI name",  // 18990320
    "Failed to get hardware vendor",  // 18990321
};

// 18990400-18990431: Miscellaneous: EP files, portals, plugins
const char *const kMiscMessages[] = {
    "Bad EP file type",  // 18990400
    "Bad EP file path",  // 18990401
    "Bad portals",  // 18990402
    "Bad description",  // 18990403
    "Bad deleted_by",  // 18990404
    "Need LIO support",  // 18990405
    "No portal",  // 18990406
    "No plugin notified",  // 18990407
    "Failed to plugin-notify",  // 18990408
    "Failed to plugin-start",  // 18990409
    "Failed to plugin-end",  // 18990410
    "Failed to create object file",  // 18990411
    "Failed to create communication",  // 18990412
    "Failed to fill EP file",  // 18990413
    "Failed to get mapped size",  // 18990414
    "Failed to add extent pool",  // 18990415
    "Failed to create EPIO journal",  // 18990416
    "Inconsistent EPIO journal",  // 18990417
    "Failed to enable extent pool",  // 18990418
    "Failed to disable extent pool",  // 18990419
    "Failed to set volume ID",  // 18990420
    "Failed to set map file path",  // 18990421
    "Failed to create progress file",  // 18990422
    "Failed to delete progress file",  // 18990423
    "Failed to set progress file",  // 18990424
    "Failed to get iSCSIConfig",  // 18990425
    "Failed to generate UUID",  // 18990426
    "iSCSI directory not found",  // 18990427
    "Bad port",  // 18990428
    "Failed to get space path of vspace",  // 18990429
    "Not accepted by filter",  // 18990430
    "Plugin abort depart task",  // 18990431
};

// 18990500-18990611: LUNs
const char *const kLunMessages[] = {
    "Bad LUN type",  // 18990500
    "Bad LUN location",  // 18990501
    "Bad LUN size",  // 18990502
    "Bad LUN name",  // 18990503
    "Bad LUN ID",  // 18990504
    "Bad LUN UUID",  // 18990505
    "Bad LUN is_same_pool",  // 18990506
    "Bad LUN extent_size",  // 18990507
    "Bad source LUN UUID",  // 18990508
    "Bad destination LUN UUID",  // 18990509
    "Bad exporting location",  // 18990510
    "Bad exporting LUN name",  // 18990511
    "Bad exported LUN UUID",  // 18990512
    "Bad snapshot_name",  // 18990513
    "Bad is_locked",  // 18990514
    "Bad is_app_consistent",  // 18990515
    "Bad is_count_only",  // 18990516
    "Bad additional",  // 18990517
    "Bad snapshot_note",  // 18990518
    "Bad snapshot ID",  // 18990519
    "Bad snapshot UUID",  // 18990520
    "Bad snapshot time",  // 18990521
    "Bad new_name",  // 18990522
    "Bad new_size",  // 18990523
    "Bad app_key",  // 18990524
    "Bad export_status",  // 18990525
    "Bad import_status",  // 18990526
    "Bad is_scheduled",  // 18990527
    "Bad is_for_trash",  // 18990528
    "Bad is_for_unsync_size",  // 18990529
    "No LUN UUID",  // 18990530
    "No such LUN",  // 18990531
    "No such snapshot",  // 18990532
    "No such family",  // 18990533
    "LUN is mapped",  // 18990534
    "LUN is locked",  // 18990535
    "LUN not loaded",  // 18990536
    "LUN config repaired",  // 18990537
    "Duplicated LUN name",  // 18990538
    "Cannot clone a block LUN",  // 18990539
    "Cannot delete locked snapshot",  // 18990540
    "Reach max LUN count",  // 18990541
    "Reach max target count",  // 18990542
    "Reach max snapshot count",  // 18990543
    "Family config repaired",  // 18990544
    "Snapshot config repaired",  // 18990545
    "Snapshot not loaded",  // 18990546
    "Snapshot is locked",  // 18990547
    "Failed to create LUN",  // 18990548
    "Failed to convert to sink",  // 18990549
    "Failed to load LUN config",  // 18990550
    "Failed to delete LUN",  // 18990551
    "Failed to clone LUN",  // 18990552
    "Failed to mirror LUN",  // 18990553
    "Failed to promote LUN",  // 18990554
    "Failed to get LUN ID",  // 18990555
    "Failed to add LUN config",  // 18990556
    "Failed to list LUN",  // 18990557
    "Failed to load family config",  // 18990558
    "Failed to add family config",  // 18990559
    "Failed to remove family config",  // 18990560
    "Failed to remove snapshot",  // 18990561
    "Failed to remove retention policy",  // 18990562
    "Failed to run retention policy",  // 18990563
    "Failed to remove LUN backup task",  // 18990564
    "Failed to remove schedule snapshot task",  // 18990565
    "Failed to get extent size",  // 18990566
    "Failed to get snapshot count",  // 18990567
    "Failed to access family config",  // 18990568
    "Failed to take a snapshot",  // 18990569
    "Failed to map target",  // 18990570
    "Failed to get snapshot info",  // 18990571
    "Failed to get new snapshot name",  // 18990572
    "Failed to load snapshot config",  // 18990573
    "Failed to clone snapshot",  // 18990574
    "Failed to load snapshot",  // 18990575
    "Failed to unload snapshot",  // 18990576
    "Failed to enable snapshot",  // 18990577
    "Failed to load LUN",  // 18990578
    "Failed to unload LUN",  // 18990579
    "Failed to get unused lid",  // 18990580
    "Failed to get unused sid",  // 18990581
    "Failed to update LUN",  // 18990582
    "Failed to get update LUN backup task",  // 18990583
    "Failed to pass space check",  // 18990584
    "Failed to finish export",  // 18990585
    "Failed to finish import",  // 18990586
    "Failed to get LUN status",  // 18990587
    "Export interrupt",  // 18990588
    "Import interrupt",  // 18990589
    "Now is exporting",  // 18990590
    "Now is importing",  // 18990591
    "Now is not exporting",  // 18990592
    "Now is not importing",  // 18990593
    "I/O error",  // 18990594
    "Failed to finish mapping file operation",  // 18990595
    "Bad is_user_locked",  // 18990596
    "Bad lun use",  // 18990597
    "Bad snapshot type",  // 18990598
    "Bad parent UUID",  // 18990599
    "Failed to get loopback device path",  // 18990600
    "Failed to check if LUN is mapped to vhost",  // 18990601
    "Bad lun category",  // 18990602
    "Bad lun feasibility check type",  // 18990603
    "Failed to check LUN feasibility",  // 18990604
    "LUN hard feasibility check not passed",  // 18990605
    "LUN soft feasibility check not passed",  // 18990606
    "Bad is_soft_feas_ignored",  // 18990607
    "Import kernel success",  // 18990608
    "Import checksum error",  // 18990609
    "Bad new type",  // 18990610
    "Bad new location",  // 18990611
};

// 18990700-18990740: Targets
const char *const kTargetMessages[] = {
    "Bad target name",  // 18990700
    "Bad target iqn",  // 18990701
    "Bad target auth_type",  // 18990702
    "Bad target max_sessions",  // 18990703
    "Bad target user",  // 18990704
    "Bad target password",  // 18990705
    "Bad target mutual_user",  // 18990706
    "Bad target mutual_password",  // 18990707
    "Bad target auth info",  // 18990708
    "Bad target permission",  // 18990709
    "Bad target ID",  // 18990710
    "Bad target acl",  // 18990711
    "Bad target acl authority",  // 18990712
    "No such target",  // 18990713
    "Failed to create target",  // 18990714
    "Failed to create ACL masking",  // 18990715
    "Failed to delete ACL masking",  // 18990716
    "Failed to update ACL masking",  // 18990717
    "Failed to enable target",  // 18990718
    "Failed to disable target",  // 18990719
    "Failed to delete target",  // 18990720
    "Failed to list target",  // 18990721
    "Failed to load target",  // 18990722
    "Failed to unload target",  // 18990723
    "Failed to load target config",  // 18990724
    "Failed to add target config",  // 18990725
    "Failed to update target config",  // 18990726
    "Failed to remove target config",  // 18990727
    "Failed to load target mapping",  // 18990728
    "Failed to unload target mapping",  // 18990729
    "Failed to remove target mapping",  // 18990730
    "Failed to load mapping config",  // 18990731
    "Failed to get mapping status",  // 18990732
    "Failed to enable isert",  // 18990733
    "Failed to enumerate target network portals",  // 18990734
    "Bad target external ips",  // 18990735
    "Bad target has_header_checksum",  // 18990736
    "Bad target has_data_checksum",  // 18990737
    "Bad target max_recv_seg_bytes",  // 18990738
    "Bad target max_send_seg_bytes",  // 18990739
    "Bad target initiator_iqns",  // 18990740
};

// 18990800-18990888: Tasks and replication
const char *const kTaskMessages[] = {
    "Not a source task",  // 18990800
    "Not a destination task",  // 18990801
    "Not a restorable task",  // 18990802
    "Not allowed to do full sync",  // 18990803
    "Task is not running",  // 18990804
    "Task is not playable",  // 18990805
    "Task is not stopped",  // 18990806
    "Task is stopped",  // 18990807
    "Task is locked",  // 18990808
    "Task is track played",  // 18990809
    "No such task",  // 18990810
    "No idle tracks",  // 18990811
    "No such track",  // 18990812
    "No aligned track",  // 18990813
    "Rewind to latest version",  // 18990814
    "Auto rewinding",  // 18990815
    "Failover detected",  // 18990816
    "Stop sending snapshot",  // 18990817
    "Bad replication task info",  // 18990818
    "Bad replication task UUID",  // 18990819
    "Bad source LUN UUID",  // 18990820
    "Bad destination LUN UUID",  // 18990821
    "Bad source Node UUID",  // 18990822
    "Bad destination Node UUID",  // 18990823
    "Bad is_source",  // 18990824
    "Bad replication type",  // 18990825
    "Bad queue size",  // 18990826
    "Bad async period",  // 18990827
    "Bad track size limit",  // 18990828
    "Bad rebase period",  // 18990829
    "Bad source task UUID",  // 18990830
    "Bad task UUID",  // 18990831
    "Bad is_time_up",  // 18990832
    "Bad task status",  // 18990833
    "Bad parent task UUID",  // 18990834
    "Bad track UUID",  // 18990835
    "Bad track version",  // 18990836
    "Bad source track UUID",  // 18990837
    "Bad destination track UUID",  // 18990838
    "Bad drop_idle_tracks",  // 18990839
    "Bad delete_lun",  // 18990840
    "Bad mapped_size",  // 18990841
    "Bad to_source",  // 18990842
    "Bad track_note",  // 18990843
    "Bad source address",  // 18990844
    "Bad destination address",  // 18990845
    "Bad source port",  // 18990846
    "Bad destination port",  // 18990847
    "Bad is_full_sync_allowed",  // 18990848
    "Bad is_data_encrypted",  // 18990849
    "Bad do_update_track",  // 18990850
    "Bad do_send_track",  // 18990851
    "Bad source_snapshots",  // 18990852
    "Bad base_snapshot_uuid",  // 18990853
    "Bad sending_snapshot_uuid",  // 18990854
    "Failed to create replication task",  // 18990855
    "Failed to delete replication task",  // 18990856
    "Failed to start replication task",  // 18990857
    "Failed to load replication task config",  // 18990858
    "Failed to get replication task UUID",  // 18990859
    "Failed to update track",  // 18990860
    "Failed to send track",  // 18990861
    "Failed to sync source task",  // 18990862
    "Failed to sync destination task",  // 18990863
    "Failed to list task",  // 18990864
    "Failed to get track status",  // 18990865
    "Failed to list track",  // 18990866
    "Failed to get track info",  // 18990867
    "Failed to freeze task",  // 18990868
    "Failed to convert task",  // 18990869
    "Failed to load track",  // 18990870
    "Failed to unload track",  // 18990871
    "Failed to restore task",  // 18990872
    "Failed to rebase task",  // 18990873
    "Failed to set status",  // 18990874
    "Failed to unset status",  // 18990875
    "Failed to get base version",  // 18990876
    "Failed to get progress",  // 18990877
    "Failed to do task action",  // 18990878
    "Failed to complete restore",  // 18990879
    "Failed to complete rebase",  // 18990880
    "Failed to pause sending track",  // 18990881
    "Failed to get playing candidate",  // 18990882
    "Failed to clone track",  // 18990883
    "Failed to delete track",  // 18990884
    "Failed to set base snapshot",  // 18990885
    "Failed to send snapshot",  // 18990886
    "Failed to compute unsync size",  // 18990887
    "Failed to create replica LUN",  // 18990888
};

// 18991000-18991009: Virtual LUNs
const char *const kVirtualLunMessages[] = {
    "Bad vLUN type",  // 18991000
    "Bad vLUN UUID",  // 18991001
    "No vLUN UUID",  // 18991002
    "Failed to create vLUN",  // 18991003
    "Failed to bind",  // 18991004
    "Failed to load vLUN config",  // 18991005
    "Failed to delete vLUN",  // 18991006
    "Failed to load vLUN status",  // 18991007
    "Failed to load NAA",  // 18991008
    "Failed to unload NAA",  // 18991009
};

// 18991100-18991125: Nodes
const char *const kNodeMessages[] = {
    "Bad node UUID",  // 18991100
    "Bad node hostname",  // 18991101
    "Bad node port",  // 18991102
    "Bad node protocol",  // 18991103
    "Bad node ROD key",  // 18991104
    "Bad node account",  // 18991105
    "Bad node password",  // 18991106
    "Bad node OTP code",  // 18991107
    "Invaild net family",  // 18991108
    "No such node",  // 18991109
    "No node UUID",  // 18991110
    "Node UUID exists",  // 18991111
    "Failed to load node config",  // 18991112
    "Failed to init CGI",  // 18991113
    "Failed to get auth type",  // 18991114
    "Failed to set CGI option",  // 18991115
    "Failed to login without auth",  // 18991116
    "Failed to load ROD key",  // 18991117
    "Failed to set ROD key",  // 18991118
    "Failed to get ROD key",  // 18991119
    "Failed to list nodes",  // 18991120
    "Failed to get address info",  // 18991121
    "Bad subvolume root path",  // 18991122
    "Bad subvolume progress status",  // 18991123
    "Subvolume convert is running",  // 18991124
    "Bad iSCSI directory rootpath",  // 18991125
};

// 18991200-18991207: LUN backup
const char *const kLunBackupMessages[] = {
    "Failed to connect to target",  // 18991200
    "Failed to disconnect from target",  // 18991201
    "Bad lunbkp type",  // 18991202
    "Failed to get nr_write_thread from orloinfo",  // 18991203
    "Smartdd failed",  // 18991204
    "Bad block device path",  // 18991205
    "Failed to readlink",  // 18991206
    "Bad lunbkp estimate size",  // 18991207
};

struct Block {
    unsigned int base;
    unsigned int count;
    const char *const *messages;
};

const Block kBlocks[] = {
    {18990000u, sizeof(kGeneralMessages) / sizeof(kGeneralMessages[0]), kGeneralMessages},
    {18990200u, sizeof(kWebApiMessages) / sizeof(kWebApiMessages[0]), kWebApiMessages},
    {18990300u, sizeof(kConfigFilesMessages) / sizeof(kConfigFilesMessages[0]), kConfigFilesMessages},
    {18990400u, sizeof(kMiscMessages) / sizeof(kMiscMessages[0]), kMiscMessages},
    {18990500u, sizeof(kLunMessages) / sizeof(kLunMessages[0]), kLunMessages},
    {18990700u, sizeof(kTargetMessages) / sizeof(kTargetMessages[0]), kTargetMessages},
    {18990800u, sizeof(kTaskMessages) / sizeof(kTaskMessages[0]), kTaskMessages},
    {18991000u, sizeof(kVirtualLunMessages) / sizeof(kVirtualLunMessages[0]), kVirtualLunMessages},
    {18991100u, sizeof(kNodeMessages) / sizeof(kNodeMessages[0]), kNodeMessages},
    {18991200u, sizeof(kLunBackupMessages) / sizeof(kLunBackupMessages[0]), kLunBackupMessages},
};

const char kUndefined[] = "Undefined error string";

}  // namespace

const char *ORLOiSCSIErrStr(unsigned int code) {
    for (const Block &b : kBlocks) {
        if (code - b.base < b.count) {
            const char *msg = b.messages[code - b.base];
            return (msg == nullptr || msg[0] == '\0') ? kUndefined : msg;
        }
    }
    // -1..-255 are negated errno values; anything else is passed to strerror as it is.
    int err = code < 0xFFFFFF01u ? static_cast<int>(code) : -static_cast<int>(code);
    const char *text = strerror(err);
    return text != nullptr ? text : kUndefined;
}
