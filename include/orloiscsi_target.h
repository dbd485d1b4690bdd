/*
 * Targets: the iSCSI target records, their access lists and the mappings that make LUNs
 * visible through them.
 *
 * Targets are the sections "iSCSI_T<tid>" of /usr/orlo/etc/iscsi_target.conf, guarded by
 * /tmp/iscsi/iscsi_target.conf.lock; access lists are the sections
 * "iSCSI_ACL_T<tid>_<initiator>" of /usr/orlo/etc/iscsi_acl.conf, guarded by
 * /tmp/iscsi/iscsi_acl.conf.lock.  Readers hold a file's lock shared, writers exclusive,
 * waiting up to 60 seconds, per call.  Where both are needed the target file's lock is
 * taken first.  CHAP secrets are plain text in memory and enciphered in the file
 * (OLIBCCryptSzEncrypt, olibc.h).  Lists are filled by the loaders and freed by the holder
 * (ORLOiSCSITargetListFree, ORLOiSCSITargetAclListFree).  See docs/targets.md.
 *
 * Mappings are the sections "iSCSI_MAP_T<tid>_L<lid>" of /usr/orlo/etc/iscsi_mapping.conf,
 * guarded by /tmp/iscsi/iscsi_mapping.conf.lock (shared for reading, exclusive for
 * writing, 60 seconds).  Every function returns 0 or a result code (orloiscsi_base.h) and
 * logs each failure once at LOG_ERR.  Threads: no in-process lock is taken; lock files
 * serialise processes and threads alike.
 */
#ifndef ORLOISCSI_TARGET_H
#define ORLOISCSI_TARGET_H

#include <stdbool.h>
#include <stdint.h>

#include "olibc.h"
#include "orlo_export.h"
#include "orloiscsi_list.h"

ORLO_EXTERN_C_BEGIN

/* ---- Sizes and ranges ---- */
#define ORLO_ISCSI_TID_MIN 1
#define ORLO_ISCSI_TID_MAX 256
#define ORLO_ISCSI_TARGET_NAME_SIZE 256       /* name and IQN arrays */
#define ORLO_ISCSI_TARGET_PORTALS_SIZE 2048
#define ORLO_ISCSI_TARGET_CHAP_SIZE 64        /* user names and secrets */
#define ORLO_ISCSI_ISCSI_NAME_MAX 223         /* longest iSCSI name (bytes) */
#define ORLO_ISCSI_SEG_BYTES_MIN 512          /* data segment lengths the kernel takes */
#define ORLO_ISCSI_SEG_BYTES_MAX 16777215
#define ISCSI_TARGET_DEFAULT_TPGT_NUMBER 1

/* Authentication (auth_type). */
#define ORLO_ISCSI_AUTH_NONE 0
#define ORLO_ISCSI_AUTH_CHAP 1
#define ORLO_ISCSI_AUTH_MUTUAL_CHAP 2

/* The target record.  Strings are NUL-terminated inside their arrays. */
typedef struct _tag_struct_iscsi_target_ {
    int32_t tid;                /* 1..256; names the section "iSCSI_T<tid>"; key "tid" */
    bool enabled;               /* wanted in the kernel; "enabled" */
    bool enabled_as_loaded;     /* "enabled" as read from the file; never written */
    bool has_header_checksum;   /* CRC32C header digest; "hdr_chksum" */
    bool has_data_checksum;     /* CRC32C data digest; "data_chksum" */
    bool bkp_obj;               /* serves a LUN backup; hidden from load-all; "bkp_obj" */
    char name[ORLO_ISCSI_TARGET_NAME_SIZE];           /* display name; "name" */
    char iqn[ORLO_ISCSI_TARGET_NAME_SIZE];            /* iSCSI name of the node; "iqn" */
    char network_portals[ORLO_ISCSI_TARGET_PORTALS_SIZE]; /* "a.b.c.d:port,[v6]:port"; "network_portals" */
    int32_t max_recv_seg_bytes; /* MaxRecvDataSegmentLength; "recv_seg_bytes" */
    int32_t max_send_seg_bytes; /* MaxXmitDataSegmentLength; "send_seg_bytes" */
    int32_t max_sessions;       /* "max_sessions", 1 when absent */
    int32_t auth_type;          /* ORLO_ISCSI_AUTH_*; "authen" and "mutual" */
    char user[ORLO_ISCSI_TARGET_CHAP_SIZE];            /* "username" */
    char password[ORLO_ISCSI_TARGET_CHAP_SIZE];        /* plain; "password" enciphered */
    char mutual_user[ORLO_ISCSI_TARGET_CHAP_SIZE];     /* "mutual_username" */
    char mutual_password[ORLO_ISCSI_TARGET_CHAP_SIZE]; /* plain; "mutual_password" enciphered */
    ORLOiSCSIListLink link;     /* chains the record into a target list */
} ORLOiSCSITarget;

/* A target list (count and head); records are appended in file order. */
typedef ORLOiSCSIList ORLOiSCSITargetList;
/* The record of a link of a target list. */
#define ORLO_ISCSI_TARGET_OF(linkPtr) ORLO_ISCSI_LIST_ENTRY(linkPtr, ORLOiSCSITarget, link)
/* for (each ORLOiSCSITarget *targetVar of listPtr); linkVar is an ORLOiSCSIListLink * cursor. */
#define ORLO_ISCSI_TARGET_LIST_FOREACH(listPtr, linkVar, targetVar)                            \
    for ((linkVar) = (listPtr)->head.next;                                                     \
         (linkVar) != &(listPtr)->head && (((targetVar) = ORLO_ISCSI_TARGET_OF(linkVar)), 1);  \
         (linkVar) = (linkVar)->next)

/* ---- Filter: which target sections a load accepts; every criterion set must hold ---- */
#define ORLO_ISCSI_TARGET_FILTER_TID 0x0001u      /* "tid" equals tid */
#define ORLO_ISCSI_TARGET_FILTER_NAME 0x0004u     /* "name" equals name (case-sensitive) */
#define ORLO_ISCSI_TARGET_FILTER_IQN 0x0008u      /* "iqn" equals iqn */
#define ORLO_ISCSI_TARGET_FILTER_TID_ARRAY 0x0100u /* "tid" is one of tids[0..tidCount) */
#define ORLO_ISCSI_TARGET_FILTER_BKP 0x0400u      /* keep backup-object targets in a load-all */
#define ORLO_ISCSI_TARGET_FILTER_KIND 0x1000u     /* object kind "target" */
#define ORLO_ISCSI_TARGET_FILTER_ALL 0x7000u      /* exactly (0x200000 aside): every target but backup objects */
/* Flags 0 accept every section, backup objects included.  The configuration snapshot
 * fills this from its own filter (tid from lid, tids from lids). */
typedef struct _tag_ORLO_ISCSI_TARGET_FILTER {
    uint32_t flags;
    int32_t tid;
    const char *name;
    const char *iqn;
    const int32_t *tids;
    int32_t tidCount;
} ORLOiSCSITargetFilter;

/* ---- Target records and their file ---- */

/* Builds one record (allocated zeroed, freed by the caller with free) from the keys of one
 * section; secrets are deciphered.  18990033 for a missing required key, 18990705 for a
 * secret that cannot be deciphered. */
ORLO_EXPORT uint32_t ORLOiSCSITargetStructCreate(const OLIBC_SZHASH *hash, ORLOiSCSITarget **out);
/* Checks a record before it is stored or acted on: tid 1..256 (18990710), name (18990700),
 * IQN a valid iqn./eui./naa. name (18990701), auth_type 0..2 (18990702), max_sessions not
 * negative (18990703), user names and secrets that fit and read back (18990704..18990707,
 * secrets at most OLIBC_CRYPT_PLAIN_MAX bytes), segment lengths 512..16777215 (18990738,
 * 18990739), portals (18990004).  One log line for the first fault. */
ORLO_EXPORT uint32_t ORLOiSCSITargetStructCheck(const ORLOiSCSITarget *target);
/* 1 when s is a valid iSCSI name: "iqn.yyyy-mm.<reversed domain>[:<anything>]" in lower
 * case letters, digits, ".", "-" and ":"; "eui." and 16 hex digits; "naa." and 16 or 32
 * hex digits; at most 223 bytes.  Else 0. */
ORLO_EXPORT int ORLOiSCSIIsValidIscsiName(const char *s);
/* Appends every accepted target of the file to list (a missing file is an empty result).
 * On failure the list is left empty. */
ORLO_EXPORT uint32_t ORLOiSCSITargetConfLoad(const ORLOiSCSITargetFilter *filter, ORLOiSCSITargetList *list);
/* Writes the record's section, replacing the one of its tid when present.  The record is
 * checked first as by ORLOiSCSITargetStructCheck, except that an auth_type outside 0..2
 * is logged ("Un-supported CHAP type") and stored as no authentication. */
ORLO_EXPORT uint32_t ORLOiSCSITargetConfAdd(const ORLOiSCSITarget *target);
/* Rewrites the existing section of the record's tid (18990000 when it is missing from an
 * existing file; a missing file is created).  An auth_type outside 0..2 stores empty
 * "authen" and "mutual" values. */
ORLO_EXPORT uint32_t ORLOiSCSITargetConfUpdate(const ORLOiSCSITarget *target);
/* Removes the target's section and then its access-list sections.  0, or -1 with the
 * reason in the platform error. */
ORLO_EXPORT int ORLOiSCSITargetConfRemove(const ORLOiSCSITarget *target);
/* Zeroes list and loads the targets filter accepts; 18990425 when the load fails. */
ORLO_EXPORT uint32_t ORLOiSCSITargetGetByFilter(const ORLOiSCSITargetFilter *filter, ORLOiSCSITargetList *list);
/* The targets with that name (flags 0x1004 | extraFlags) or tid (0x1001 | extraFlags);
 * pass 0x0400 to see backup-object targets in a load-all. */
ORLO_EXPORT uint32_t ORLOiSCSITargetConfGetByName(const char *name, uint32_t extraFlags, ORLOiSCSITargetList *list);
ORLO_EXPORT uint32_t ORLOiSCSITargetConfGetByTid(int32_t tid, uint32_t extraFlags, ORLOiSCSITargetList *list);
/* Copies the first matching target into *target (its link cleared); 18990713 when none,
 * 18990724 when the query failed. */
ORLO_EXPORT uint32_t ORLOiSCSITargetGetByName(const char *name, uint32_t extraFlags, ORLOiSCSITarget *target);
ORLO_EXPORT uint32_t ORLOiSCSITargetGetByTid(int32_t tid, uint32_t extraFlags, ORLOiSCSITarget *target);
/* The number of targets with that name (0 when free), or -1. */
ORLO_EXPORT int ORLOiSCSITargetIsNameUsed(const char *name);
/* The first free name "<prefix>-<k>" for k = 1..1001 into out: 0, or -1 (also when the
 * name does not fit out; it is never cut). */
ORLO_EXPORT int ORLOiSCSITargetUnusedNameFind(const char *prefix, char *out, int outSize);
/* The smallest tid no target (backup objects included) uses, into target->tid; 18990710
 * when all 256 are taken. */
ORLO_EXPORT uint32_t ORLOiSCSITargetUnusedTidFind(ORLOiSCSITarget *target);
/* Removes and frees every record of a target list; NULL is ignored. */
ORLO_EXPORT void ORLOiSCSITargetListFree(ORLOiSCSITargetList *list);

/* ---- Access lists ---- */

/* What an initiator may do: 0 nothing, 1 read, 3 read and write.  2 is accepted from older
 * configurations and treated as read-write. */
typedef enum {
    ISCSI_TARGET_AUTHORITY_NONE = 0,
    ISCSI_TARGET_AUTHORITY_RO = 1,
    ISCSI_TARGET_AUTHORITY_LEGACY_RW = 2,
    ISCSI_TARGET_AUTHORITY_RW = 3
} ISCSI_TARGET_AUTHORITY;

/* The initiator name of the default entry, which stands for every initiator not listed
 * (36 characters). */
#define ORLO_ISCSI_DEFAULT_ACL_INITIATOR "iqn.2000-01.com.orlo-nas:default.acl"

/* An access-list entry. */
typedef struct _tag_struct_iscsi_acl_ {
    int32_t tid;
    char initiator[ORLO_ISCSI_TARGET_NAME_SIZE];
    int32_t authority;          /* ISCSI_TARGET_AUTHORITY */
    ORLOiSCSIListLink link;
} ORLOiSCSIAcl;

typedef ORLOiSCSIList ORLOiSCSIAclList;
#define ORLO_ISCSI_ACL_OF(linkPtr) ORLO_ISCSI_LIST_ENTRY(linkPtr, ORLOiSCSIAcl, link)
#define ORLO_ISCSI_ACL_LIST_FOREACH(listPtr, linkVar, aclVar)                                  \
    for ((linkVar) = (listPtr)->head.next;                                                     \
         (linkVar) != &(listPtr)->head && (((aclVar) = ORLO_ISCSI_ACL_OF(linkVar)), 1);        \
         (linkVar) = (linkVar)->next)

/* Builds one entry (allocated zeroed, freed with free) from the keys of one section: its
 * "authority"; tid and initiator are the caller's to fill.  18990033 when it is missing. */
ORLO_EXPORT uint32_t ORLOiSCSITargetAclStructCreate(const OLIBC_SZHASH *hash, ORLOiSCSIAcl **out);
/* Stores an entry, replacing that initiator's entry of the tid when present.  tid 1..256
 * (18990710), a valid iSCSI initiator name (18990711), authority 0..3 (18990712). */
ORLO_EXPORT uint32_t ORLOiSCSITargetConfAclAdd(int32_t tid, const char *initiator, int32_t authority);
/* Changes the authority of an existing entry; 18990000 when there is none. */
ORLO_EXPORT uint32_t ORLOiSCSITargetConfAclUpdate(int32_t tid, const char *initiator, ISCSI_TARGET_AUTHORITY authority);
/* Removes one entry; a missing file or entry is success. */
ORLO_EXPORT uint32_t ORLOiSCSITargetConfAclRemove(int32_t tid, const char *initiator);
/* Removes every entry of a tid. */
ORLO_EXPORT uint32_t ORLOiSCSITargetConfAclsRemove(int32_t tid);
/* Appends the entries of a tid to list in file order; none is an empty result. */
ORLO_EXPORT uint32_t ORLOiSCSITargetConfAclLoad(int32_t tid, ORLOiSCSIAclList *list);
/* Whether that entry is stored (false also when it cannot be read). */
ORLO_EXPORT bool ORLOiSCSITargetConfAclIsExist(int32_t tid, const char *initiator);
/* Removes and frees every entry of an access list; NULL is ignored. */
ORLO_EXPORT void ORLOiSCSITargetAclListFree(ORLOiSCSIAclList *list);

/* ---- Mappings: LUN lid seen through target tid as LUN number lun ---- */
#define ORLO_ISCSI_MAPPING_LUN_MAX 255        /* LUN numbers are 0..255 */
#define ORLO_ISCSI_MAPPINGS_PER_TARGET_MAX 256
/* Mapping criterion of the load filter (the others are the tid bit 0x0001 and the lid bit
 * 0x0020 of the LUN filter): the section's "lun" equals the filter's lun. */
#define ORLO_ISCSI_MAPPING_FILTER_LUN 0x0040u

struct _tag_ORLO_ISCSI_LUN;

/* The mapping record: one section "iSCSI_MAP_T<tid>_L<lid>" with the keys "tid", "lid"
 * and "lun".  Allocated zeroed; held by a configuration snapshot (orloiscsi_conf.h), which
 * points pLun and pTrg at its own LUN and target records (NULL while unresolved). */
typedef struct _tag_struct_iscsi_mapping_ {
    int32_t lun;                      /* LUN number seen by initiators, 0..255; "lun" */
    int32_t lid;                      /* 1..1024; "lid" */
    int32_t tid;                      /* 1..256; "tid" */
    struct _tag_ORLO_ISCSI_LUN *pLun; /* the LUN record of the same snapshot, or NULL */
    ORLOiSCSITarget *pTrg;            /* the target record of the same snapshot, or NULL */
    ORLOiSCSIListLink link;           /* chains the record into a mapping list */
} ORLOiSCSIMapping;

/* A mapping list (count and head), in file order. */
typedef ORLOiSCSIList ORLOiSCSIMappingList;
#define ORLO_ISCSI_MAPPING_OF(linkPtr) ORLO_ISCSI_LIST_ENTRY(linkPtr, ORLOiSCSIMapping, link)
#define ORLO_ISCSI_MAPPING_LIST_FOREACH(listPtr, linkVar, mapVar)                              \
    for ((linkVar) = (listPtr)->head.next;                                                     \
         (linkVar) != &(listPtr)->head && (((mapVar) = ORLO_ISCSI_MAPPING_OF(linkVar)), 1);    \
         (linkVar) = (linkVar)->next)

/* Builds one record (allocated zeroed, freed with free) from the keys of one section;
 * "tid", "lid" and "lun" are all required (18990033). */
ORLO_EXPORT uint32_t ORLOiSCSITargetMappingObjectCreate(const OLIBC_SZHASH *hash, ORLOiSCSIMapping **out);
/* Writes the section of the mapping (tid 1..256, lid 1..1024, lun 0..255; else 18990004),
 * replacing the one of that tid and lid when present.  The kernel is not touched. */
ORLO_EXPORT uint32_t ORLOiSCSITargetConfMappingAdd(int32_t tid, int32_t lid, int32_t lun);
/* Removes the section of that tid and lid; a missing file or section is success.  The
 * kernel is not touched. */
ORLO_EXPORT uint32_t ORLOiSCSITargetConfMappingRemove(int32_t tid, int32_t lid);
/* Loading mappings and linking them to their records: ORLOiSCSITargetConfMappingLoad and
 * ORLOiSCSITargetConfMappingMake work on a configuration snapshot (orloiscsi_conf.h). */

/* Removes every mapping section of LUN lid (1..1024), whatever its target, from the
 * mapping file under the file's lock.  The kernel side is not touched.  A missing file,
 * or a LUN without mappings, is success and leaves the file as it is. */
ORLO_EXPORT uint32_t ORLOiSCSILunMappingRemove(int32_t lid);

/* ---- Target unload: taking target nodes out of the kernel's iSCSI fabric ----
 * These work from what configfs holds, not from the configuration files, so they also
 * clear nodes the files no longer describe and nodes a failed load left half-built.
 * The tree is dismantled bottom-up; the first failing step ends the unload with its
 * code and what was removed stays removed, so repeating the call carries on.  Paths
 * are configfs paths such as "/config/target/iscsi/<iqn>/tpgt_1". */
/* Unloads the node /config/target/iscsi/<iqn>; a node that is not there is success. */
ORLO_EXPORT uint32_t ORLOiSCSITargetUnloadByIqn(const char *iqn);
/* Unloads a node directory: for each portal group, switch it off, remove its portals,
 * node access lists and LUN entries and the group; then the node itself. */
ORLO_EXPORT uint32_t ORLOiSCSITargetUnloadByConfigfsPath(const char *node_path);
/* Removes every portal under <tpg_path>/np. */
ORLO_EXPORT uint32_t ORLOiSCSITargetPortalGroupNpUnload(const char *tpg_path);
/* Removes a node access list directory: its LUN entries lose their links and go first. */
ORLO_EXPORT uint32_t ORLOiSCSITargetPortalGroupNodeAclRemove(const char *acl_path);
/* Removes a portal-group LUN entry: its backstore link, then the entry. */
ORLO_EXPORT uint32_t ORLOiSCSITargetPortalGroupLunRemoveEntry(const char *lun_path);

/* ---- iSNS client ----
 * Running targets are announced to an iSNS server (RFC 4171) when
 * /usr/orlo/etc/isns.conf (key=value lines) says isns_enable=yes; the server is
 * isns_server ("name", "a.b.c.d", "[v6]", each with an optional ":port", 3205 otherwise).
 * Optional keys: isns_entity (the entity this appliance registers as; the host name
 * otherwise), isns_registration_period (seconds asked of the server, 3600 unless set)
 * and isns_timeout (seconds a connection attempt may take, 1..60, 5 unless set).  The
 * appliance is one entity; every target in the kernel (backup objects left out) is a
 * storage node in it with the portals of its portal group.  While iSNS is off every call
 * here does nothing and succeeds.  Register and deregister are best effort: the target
 * life cycle never checks them.  Each failure is logged once.  The client keeps no
 * socket, thread or timer between calls; registrations stay on the server for the
 * registration period and are renewed by every connection, by ORLOiSCSIiSNSRefresh and
 * by a connected process whose registrations are half-way to expiry.  All take the
 * target lock. */
ORLO_EXPORT bool ORLOiSCSIiSNSIsEnabled(void);
/* Connects and registers every running target, withdrawing the entity's other nodes. */
ORLO_EXPORT uint32_t ORLOiSCSIiSNSConnect(void);
ORLO_EXPORT bool ORLOiSCSIiSNSIsConnected(void);
/* Withdraws the whole entity from the server and forgets the connection. */
ORLO_EXPORT uint32_t ORLOiSCSIiSNSDisconnect(void);
/* Renews the registrations (connecting when needed); run it periodically. */
ORLO_EXPORT uint32_t ORLOiSCSIiSNSRefresh(void);
/* isns_enable=yes, then every running target registered (that result returned). */
ORLO_EXPORT uint32_t ORLOiSCSIiSNSEnable(void);
/* The entity withdrawn (best effort), then isns_enable=no. */
ORLO_EXPORT uint32_t ORLOiSCSIiSNSDisable(void);
/* A new isns_server (18990203 / 18990428 for a malformed one); with iSNS on, withdrawn
 * from the old server and registered with the new one. */
ORLO_EXPORT uint32_t ORLOiSCSIiSNSServerSet(const char *server);

typedef struct _tag_struct_iscsi_isns_status_ {
    bool enabled;                /* isns_enable says yes */
    bool connected;              /* this process is connected */
    bool reachable;              /* the server answered the status query just now */
    char server[256];            /* isns_server as written ("" when unset) */
    char entity[256];            /* the entity this appliance registers as */
    int32_t port;                /* the server's port */
    int32_t timeout;             /* seconds a connection attempt may take */
    int32_t registration_period; /* seconds asked of the server */
    int32_t granted_period;      /* seconds the server granted this process (0: not known) */
    int32_t registered;          /* storage nodes the server holds in the entity (-1: not known) */
    uint32_t error;              /* why the settings or the server failed: 0 or a result code */
} ORLOiSCSIiSNSStatus;
ORLO_EXPORT uint32_t ORLOiSCSIiSNSStatusGet(ORLOiSCSIiSNSStatus *status);

/* Best effort: callers never check these. */
ORLO_EXPORT uint32_t ORLOiSCSITargetiSNSRegister(const ORLOiSCSITarget *target);
ORLO_EXPORT uint32_t ORLOiSCSITargetiSNSDeregister(const ORLOiSCSITarget *target);
/* Whether the server holds the target in this appliance's entity (false with iSNS off). */
ORLO_EXPORT uint32_t ORLOiSCSITargetiSNSIsRegistered(const ORLOiSCSITarget *target, bool *registered);

/* ---- Access lists in the kernel: node access lists, their LUN entries and CHAP ----
 * Paths lie under "/config/target/iscsi/<iqn>/tpgt_<tpgt>/acls/<initiator>".  The default
 * entry (ORLO_ISCSI_DEFAULT_ACL_INITIATOR) gets a node access list of its own only under
 * the older target core (version 2); elsewhere the portal group's demo-mode attributes
 * stand for it.  Write protection: an initiator writes only with read-write authority (3,
 * or 2) on a volume that is not mounted read-only; anything else is protected.  Bad
 * arguments give 18990003 / 18990004; a path that does not fit 320 bytes 18990050. */
/* Makes the initiator's node access list (an existing one is kept); 18990028. */
ORLO_EXPORT uint32_t ORLOiSCSILioTargetNodeAclAdd(const char *iqn, int tpgt, const char *initiator);
/* Makes the initiator's entry lun_<lun> and links it as "lio_lun" to the group's
 * lun/lun_<lun>, which must be linked to a backstore.  An entry made here is removed
 * again when the link fails. */
ORLO_EXPORT uint32_t ORLOiSCSILioTargetLunAclInitiatorAdd(const char *iqn, int tpgt, const char *initiator, int lun);
/* Removes the "lio_lun" link and the entry; what is already gone counts as removed. */
ORLO_EXPORT uint32_t ORLOiSCSILioTargetLunAclInitiatorRemove(const char *iqn, int tpgt, const char *initiator, int lun);
/* Writes the entry's write_protect from entry->authority and the read-only state of the
 * volume of the LUN linked under lun/lun_<lun> (18990011 when none is linked). */
ORLO_EXPORT uint32_t ORLOiSCSILioTargetLunInitiatorRw(const char *iqn, int tpgt, const ORLOiSCSIAcl *entry, int lun);
/* Writes the target's CHAP credentials into the "auth" directory of the node access list
 * of every stored entry of its tid: kind 1 userid and password, kind 2 also
 * userid_mutual and password_mutual.  Another kind is refused with 18990004 as soon as
 * an entry would need it; an empty access list writes nothing. */
ORLO_EXPORT uint32_t ORLOiSCSILioTargetMaskingsChapAuthAdd(const ORLOiSCSITarget *target, int kind);

/* ---- Mappings in the kernel ----
 * A mapping is kernel first, file second: adding writes the portal group's lun_<n> (with
 * its link to the LUN's backstore and one entry per access-list initiator) and then the
 * section; removing takes the kernel side out and then the section.  A failed kernel add
 * is undone in the kernel and leaves the file untouched; a failed file write after a
 * kernel change is not undone.  A target that is not in the kernel only gets the section. */

struct _tag_ORLO_ISCSI_CONF;

/* Maps LUN lid into target tid as LUN number lun; a lun of 256 or more takes the smallest
 * free number.  18990004 bad tid/lid, 18990534 number taken, 18990555 no free number,
 * 18990425 / 18990724 / 18990550 when the target or LUN cannot be found. */
ORLO_EXPORT uint32_t ORLOiSCSITargetMappingAdd(int32_t tid, int32_t lid, int32_t lun);
/* Maps every lid of lids[0..count) into tid, each with the smallest free number. */
ORLO_EXPORT uint32_t ORLOiSCSITargetMappingsAdd(int32_t tid, const int32_t *lids, int count);
/* Takes the mapping out of the kernel (18990729 on failure) and removes its section. */
ORLO_EXPORT uint32_t ORLOiSCSITargetMappingRemove(int32_t tid, int32_t lid);
/* Removes the mappings of tid whose lid is in lids[0..count): 0 or -1. */
ORLO_EXPORT int ORLOiSCSITargetMappingsRemove(int32_t tid, const int32_t *lids, int count);
/* Takes one mapping out of the kernel only: every initiator's lun_<n> entry, then the
 * portal group's lun_<n> with its link.  conf, when given, holds the mapping with its
 * target; NULL queries it. */
ORLO_EXPORT uint32_t ORLOiSCSITargetMappingUnload(int32_t tid, int32_t lid, const struct _tag_ORLO_ISCSI_CONF *conf);
/* The kernel side of one mapping: loads the LUN's backstore, makes lun/lun_<n>, sets an
 * advanced LUN's defer_queue_mode, links the backstore and adds each access-list entry's
 * LUN entry with its write protection (the default entry only under target-core
 * version 2).  On failure the entries and lun_<n> made here are removed again. */
ORLO_EXPORT uint32_t ORLOiSCSILioMappingAdd(const ORLOiSCSITarget *target, const struct _tag_ORLO_ISCSI_LUN *lun,
                                            int32_t n, const ORLOiSCSIAclList *acls);
/* *used: whether a stored mapping of tid has number n (0..255). */
ORLO_EXPORT uint32_t ORLOiSCSITargetIsLunMapped(int32_t tid, int32_t n, bool *used);
/* *present: whether the mapping's lun_<n> exists in the kernel (18990732 when the test
 * fails). */
ORLO_EXPORT uint32_t ORLOiSCSITargetLunIsMapped(const ORLOiSCSIMapping *mapping, bool *present);
/* The smallest LUN number 0..255 no stored mapping of tid uses, or -1 when all are taken
 * or the mappings cannot be read. */
ORLO_EXPORT int ORLOiSCSILunUnusedMappingNumberGet(int32_t tid);

/* ---- Loading targets into the kernel's iSCSI fabric ----
 * A node is /config/target/iscsi/<iqn> with its one portal group tpgt_1. */

/* Status word bits of ORLOiSCSITargetStatusGet. */
#define ORLO_ISCSI_TARGET_STATUS_PRESENT 0x1  /* tpgt_1 exists */
#define ORLO_ISCSI_TARGET_STATUS_ENABLED 0x2  /* tpgt_1/enable reads true */

/* One network portal: an address as written in a portal directory name (IPv6 without
 * brackets) and its port. */
typedef struct _tag_ORLO_ISCSI_PORTAL {
    char addr[64];
    int32_t port;
} ORLOiSCSIPortal;

/* Builds the node of a target: directories, default entry, node access lists, command
 * window, portals, CHAP, digests, segment lengths, session limit and alias; the portal
 * group is not switched on.  A node already present is success at once.  On failure the
 * half-built node is unloaded again (not with self_test, which only the self-test sets).
 * A record with enabled clear is stored with enabled set afterwards. */
ORLO_EXPORT uint32_t ORLOiSCSILioTargetLoad(ORLOiSCSITarget *target, bool self_test);
/* Loads the node when absent, adds every stored mapping with its LUN, switches the
 * portal group on and stores the record. */
ORLO_EXPORT uint32_t ORLOiSCSILioTargetEnable(ORLOiSCSITarget *target, const ORLOiSCSIAclList *acls);
/* Switches the portal group off and stores the record. */
ORLO_EXPORT uint32_t ORLOiSCSILioTargetDisable(ORLOiSCSITarget *target);
/* Writes 1, resp. 0, to the portal group's enable (Allow only when it is off). */
ORLO_EXPORT uint32_t ORLOiSCSILioTargetAllow(const ORLOiSCSITarget *target);
ORLO_EXPORT uint32_t ORLOiSCSILioTargetDisallow(const ORLOiSCSITarget *target);
/* kind 1: auth/userid and auth/password; kind 2: userid_mutual and password_mutual. */
ORLO_EXPORT uint32_t ORLOiSCSILioTargetChapAuthAdd(int kind, const char *iqn, int tpgt, const char *user,
                                                   const char *secret);
/* Makes the target's portals (see docs/targets.md for which); a failing portal is logged
 * and the others still made. */
ORLO_EXPORT uint32_t ORLOiSCSILioTargetNetworkPortalLoad(const ORLOiSCSITarget *target);
ORLO_EXPORT uint32_t ORLOiSCSILioTargetNetworkPortalAdd(const ORLOiSCSITarget *target, const char *addr, int port);
ORLO_EXPORT uint32_t ORLOiSCSILioTargetNetworkPortalRemove(const ORLOiSCSITarget *target, const char *addr, int port);
/* Parses a network_portals value ("a.b.c.d:port,[v6]:port") into out[0..max): the number
 * of portals; an entry that cannot be parsed is logged and skipped. */
ORLO_EXPORT int ORLOiSCSITargetNetworkPortalConfParse(const char *portals, ORLOiSCSIPortal *out, int max);
/* Whether /config/target/iscsi/<iqn>/tpgt_<tpgt> exists. */
ORLO_EXPORT bool ORLOiSCSILioIsTargetAlive(const char *iqn, int tpgt);
/* Makes a node access list for every stored entry of the target (the default entry only
 * under target-core version 2). */
ORLO_EXPORT uint32_t ORLOiSCSILioTargetAclAdd(const ORLOiSCSITarget *target);
/* Under the service lock: a trial target load, its outcome in /tmp/iscsi_dummy_result. */
ORLO_EXPORT uint32_t ORLOiSCSILioTargetDummyTest(void);
/* Switches the portal group's demo mode for the default entry's authority (0: off; 1:
 * on, write-protected; 3 or 2: on, writable).  Under target-core version 2 the default
 * entry is a node access list of its own, so the demo mode is always switched off. */
ORLO_EXPORT uint32_t ORLOiSCSITargetDefaultAclEnable(const ORLOiSCSITarget *target, int32_t authority);
/* Stores the default entry and applies it when the node is in the kernel. */
ORLO_EXPORT uint32_t ORLOiSCSITargetDefaultAclSet(const ORLOiSCSITarget *target, int32_t authority);
/* Unloads a target by record: portal group off and record stored, then the node. */
ORLO_EXPORT uint32_t ORLOiSCSITargetUnload(ORLOiSCSITarget *target);

/* ---- Target life cycle ---- */

/* The status word: 0 not in the kernel, 1 present with its portal group off, 3 present
 * and on.  With target NULL the target is looked up by tid. */
ORLO_EXPORT int ORLOiSCSITargetStatusGet(int32_t tid, const ORLOiSCSITarget *target);
ORLO_EXPORT bool ORLOiSCSITargetIsAlive(int32_t tid);
/* Targets (backup objects aside) whose node is in the kernel. */
ORLO_EXPORT int ORLOiSCSITargetAliveCountGet(void);
/* Finds a free tid, stores the record and, when enabled, loads it (18990722). */
ORLO_EXPORT uint32_t ORLOiSCSITargetCreate(ORLOiSCSITarget *target);
/* Unloads the stored target of the record's tid, stores the record and enables it when
 * enabled is set.  An unknown tid is success and changes nothing. */
ORLO_EXPORT uint32_t ORLOiSCSITargetUpdate(ORLOiSCSITarget *target);
/* Unloads the target, removes its mappings, then its section and access lists. */
ORLO_EXPORT uint32_t ORLOiSCSITargetRemove(ORLOiSCSITarget *target);
/* Enable: access lists loaded, ORLOiSCSILioTargetEnable (18990718).  Disable: unload
 * (18990723).  Neither changes the stored enabled flag. */
ORLO_EXPORT uint32_t ORLOiSCSITargetEnable(ORLOiSCSITarget *target);
ORLO_EXPORT uint32_t ORLOiSCSITargetDisable(ORLOiSCSITarget *target);
/* ORLOiSCSILioTargetLoad(target, false) with iSNS around it (18990722). */
ORLO_EXPORT uint32_t ORLOiSCSITargetLoad(ORLOiSCSITarget *target);

/* Entries of the state array of DisableByLid / EnableByLid (indexed by tid). */
#define ORLO_ISCSI_TARGET_STATE_ENTRIES 257
#define ORLO_ISCSI_TARGET_STATE_UNTOUCHED 0
#define ORLO_ISCSI_TARGET_STATE_STOPPED 1
#define ORLO_ISCSI_TARGET_STATE_STOP_FAILED (-1)
/* Takes down every running target LUN lid is mapped to, marking state[tid]: 0 or -1. */
ORLO_EXPORT int ORLOiSCSITargetDisableByLid(int32_t *state, int32_t lid);
/* Re-enables the targets of lid marked 1 in state. */
ORLO_EXPORT uint32_t ORLOiSCSITargetEnableByLid(int32_t *state, int32_t lid);

/* Connection status of ORLOiSCSITargetConnectionStatusGet. */
#define ORLO_ISCSI_TARGET_CONN_NONE 0      /* running, no session */
#define ORLO_ISCSI_TARGET_CONN_ACTIVE 1    /* running with a session */
#define ORLO_ISCSI_TARGET_CONN_DOWN 2      /* not running */
ORLO_EXPORT uint32_t ORLOiSCSITargetConnectionStatusGet(int32_t tid, char *out);

/* One iSCSI connection of a target (allocated zeroed, ORLO_ISCSI_SESSION_STATE_ALLOC
 * bytes). */
typedef struct _tag_ORLO_ISCSI_SESSION_STATE {
    uint8_t flag;
    char ip[46];            /* initiator address */
    char cid[128];          /* connection id, decimal */
    char iqn[256];          /* initiator name */
    ORLOiSCSIListLink link;
} ORLOiSCSISessionState;
#define ORLO_ISCSI_SESSION_STATE_ALLOC (sizeof(ORLOiSCSISessionState) > 444 ? sizeof(ORLOiSCSISessionState) : 444)
typedef ORLOiSCSIList ORLOiSCSISessionStateList;
#define ORLO_ISCSI_SESSION_STATE_OF(linkPtr) ORLO_ISCSI_LIST_ENTRY(linkPtr, ORLOiSCSISessionState, link)
#define ORLO_ISCSI_SESSION_STATE_LIST_FOREACH(listPtr, linkVar, sVar)                          \
    for ((linkVar) = (listPtr)->head.next;                                                     \
         (linkVar) != &(listPtr)->head && (((sVar) = ORLO_ISCSI_SESSION_STATE_OF(linkVar)), 1); \
         (linkVar) = (linkVar)->next)
/* Appends the target's sessions (from tpgt_1/dynamic_sessions): their number, or -1. */
ORLO_EXPORT int ORLOiSCSITargetSessionStateListGet(int32_t tid, ORLOiSCSISessionStateList *list);
ORLO_EXPORT void ORLOiSCSITargetSessionStateListFree(ORLOiSCSISessionStateList *list);
ORLO_EXPORT void ORLOiSCSIStateListFree(ORLOiSCSISessionStateList *list);

ORLO_EXTERN_C_END

#ifdef __cplusplus
#include <vector>
/* ---- Maskings: a target's access list as an ordered vector ----
 * The Create/Update/Remove forms store the request and bring a running target into line
 * with the stored list: node access lists, per-LUN entries, write protection and
 * per-initiator CHAP (18990715 / 18990717 / 18990716 on failure, for every refusal too).
 * All records of one call carry the same tid.  When the kernel cannot follow, the former
 * entries are stored and applied again, so a failed call changes nothing.  Removing an
 * initiator without entry succeeds.  The single-record forms wrap their record. */
ORLO_EXPORT uint32_t ORLOiSCSITargetMaskingGet(int32_t tid, std::vector<ORLOiSCSIAcl> &out);
ORLO_EXPORT uint32_t ORLOiSCSITargetAclIsIncluded(int32_t tid, const std::vector<ORLOiSCSIAcl> &records, bool &included);
ORLO_EXPORT uint32_t ORLOiSCSITargetMaskingsCreate(const std::vector<ORLOiSCSIAcl> &records);
ORLO_EXPORT uint32_t ORLOiSCSITargetMaskingCreate(const ORLOiSCSIAcl &record);
ORLO_EXPORT uint32_t ORLOiSCSITargetMaskingsUpdate(const std::vector<ORLOiSCSIAcl> &records);
ORLO_EXPORT uint32_t ORLOiSCSITargetMaskingUpdate(const ORLOiSCSIAcl &record);
ORLO_EXPORT uint32_t ORLOiSCSITargetMaskingsRemove(const std::vector<ORLOiSCSIAcl> &records);
ORLO_EXPORT uint32_t ORLOiSCSITargetMaskingRemove(const ORLOiSCSIAcl &record);
#endif

#endif
