/*
 * The appliance's core platform library (OLIBC*): per-thread error state, string lists
 * and hashes, section and key=value files, lock files and process execution.
 *
 * Every call that takes a path takes the appliance's own absolute path ("/usr/orlo/etc/
 * iscsi_lun.conf"); it is mapped under ORLO_SYSROOT by the OS seam when that is set.
 *
 * Threads: the error state is per thread.  Lists and hashes are not locked; a container
 * belongs to one thread at a time.  File operations take no lock of their own: callers
 * hold the file's lock file around them (OLIBCFileLockTimeByFile).
 */
#ifndef OLIBC_H
#define OLIBC_H

#include <stddef.h>
#include <stdio.h>
#include <sys/types.h>

#include "orlo_export.h"

ORLO_EXTERN_C_BEGIN

/* ---- Platform error codes kept in the per-thread error state ---- */
#define OLIBC_ERR_NONE        0x0000
#define OLIBC_ERR_OUT_OF_MEM  0x0200  /* an allocation failed */
#define OLIBC_ERR_ACCESS      0x0600  /* an access check failed */
#define OLIBC_ERR_NOT_FOUND   0x0700  /* a file, section or key does not exist */
#define OLIBC_ERR_FOPEN       0x0900  /* opening a file failed */
#define OLIBC_ERR_IO          0x0A00  /* reading or writing a file failed */
#define OLIBC_ERR_BAD_FORMAT  0x0B00  /* a file is not in the expected format */
#define OLIBC_ERR_MKDIR       0x0C00  /* creating a directory or pid file failed */
#define OLIBC_ERR_BAD_PARAM   0x0D00  /* a parameter check failed */
#define OLIBC_ERR_TOO_LONG    0x0E00  /* a value does not fit its buffer */
#define OLIBC_ERR_NO_SPACE    0x2900  /* the file system is full */
#define OLIBC_ERR_UNLINK      0x3900  /* unlink failed */
#define OLIBC_ERR_EXEC        0x3C00  /* a command could not be run or failed */
#define OLIBC_ERR_BTRFS       0x4100  /* a Btrfs ioctl failed */
#define OLIBC_ERR_CRYPT       0x5000  /* encryption or decryption failed */
#define OLIBC_ERR_CONF        0x8100  /* a configuration-file call failed */

ORLO_EXPORT void OLIBCErrSetEx(int code, const char *file, int line);
ORLO_EXPORT int OLIBCErrGet(void);
ORLO_EXPORT const char *OLIBCErrorGetFile(void);
ORLO_EXPORT int OLIBCErrorGetLine(void);
/* Sets the error state at the caller's own file and line. */
#define OLIBCErrSet(code) OLIBCErrSetEx((code), __FILE_NAME__, __LINE__)

/* ---- String list: a growable array of owned strings ---- */
typedef struct _tag_OLIBC_SZLIST {
    int nAlloc;       /* capacity of ppszItem */
    int nItem;        /* number of items */
    char **ppszItem;  /* items, each owned by the list */
} OLIBC_SZLIST, *POLIBC_SZLIST;

ORLO_EXPORT POLIBC_SZLIST OLIBCSzListAlloc(int capacity);
ORLO_EXPORT void OLIBCSzListFree(POLIBC_SZLIST pList);
/* Appends a copy; may grow (and so move) the list.  Returns the new index or -1. */
ORLO_EXPORT int OLIBCSzListPush(POLIBC_SZLIST *ppList, const char *sz);
/* Item at idx, or NULL when out of range. */
ORLO_EXPORT const char *OLIBCSzListGet(const OLIBC_SZLIST *pList, int idx);
/* Index of the first item equal to sz, or -1. */
ORLO_EXPORT int OLIBCSzListFind(const OLIBC_SZLIST *pList, const char *sz);
/* Index of sz in a list sorted ascending (binary search), or -1. */
ORLO_EXPORT int OLIBCSzListBinaryFind(const OLIBC_SZLIST *pList, const char *sz);
/* Sorts by strcmp, ascending when descending is 0.  Returns 0 or -1. */
ORLO_EXPORT int OLIBCSzListSortItems(POLIBC_SZLIST pList, int descending);
ORLO_EXPORT void OLIBCSzListRemoveAll(POLIBC_SZLIST pList);
/* Joins the items with sep into buf.  Returns the length, or -1 when it does not fit. */
ORLO_EXPORT int OLIBCSzListJoin(const OLIBC_SZLIST *pList, const char *sep, char *buf, size_t size);
/* Removes the last item, copying it into buf when buf is not NULL.  0, or -1 when empty
 * or when it does not fit (then the item stays). */
ORLO_EXPORT int OLIBCSzListPop(POLIBC_SZLIST pList, char *buf, size_t size);
ORLO_EXPORT int OLIBCSzListCount(const OLIBC_SZLIST *pList);

/* ---- String hash: key -> value, iterated in insertion order ---- */
typedef struct _tag_OLIBC_SZHASH OLIBC_SZHASH, *POLIBC_SZHASH;

ORLO_EXPORT POLIBC_SZHASH OLIBCSzHashAlloc(int capacity);
ORLO_EXPORT void OLIBCSzHashFree(POLIBC_SZHASH pHash);
/* Sets or replaces key; may grow the hash.  Returns 0 or -1. */
ORLO_EXPORT int OLIBCSzHashSetValue(POLIBC_SZHASH *ppHash, const char *key, const char *value);
/* The value, or NULL when absent. */
ORLO_EXPORT const char *OLIBCSzHashGetValue(const OLIBC_SZHASH *pHash, const char *key);
/* Removes key.  1 when removed, 0 when absent. */
ORLO_EXPORT int OLIBCSzHashRemove(POLIBC_SZHASH pHash, const char *key);
ORLO_EXPORT void OLIBCSzHashRemoveAll(POLIBC_SZHASH pHash);
ORLO_EXPORT int OLIBCSzHashCount(const OLIBC_SZHASH *pHash);
/* The idx-th pair in insertion order: 1 and the pair, or 0 past the end. */
ORLO_EXPORT int OLIBCSzHashEnum(const OLIBC_SZHASH *pHash, int idx, const char **pKey, const char **pValue);

/* ---- Section files ("[name]" headers with "\tkey=value" lines) and flat key=value files.
 * Every writer replaces the file atomically: a temporary file beside it, fsync, rename,
 * owner and mode kept.  Failures set OLIBC_ERR_CONF (or a more precise code). ---- */
ORLO_EXPORT int OLIBCFileExist(const char *path);   /* 1 for an existing path, else 0 */
ORLO_EXPORT int OLIBCFileTouch(const char *path);   /* creates an empty file if missing; 0 or negative */
/* Fills *ppList (allocating it when NULL) with the section names.  Count or negative. */
ORLO_EXPORT int OLIBCFileEnumSection(const char *path, POLIBC_SZLIST *ppList);
/* Fills *ppHash (allocating it when NULL) with the section's keys.  Negative on failure,
 * 0 when the section is absent, 1 when found. */
ORLO_EXPORT int OLIBCFileGetSection(const char *path, const char *section, POLIBC_SZHASH *ppHash);
/* Replaces section oldName by newName with the hash's pairs, each written with lineFmt
 * (two %s: key, value).  1 or more on success; 0 when oldName is absent; negative on failure. */
ORLO_EXPORT int OLIBCFileSetSection(const char *path, const char *oldName, const char *newName,
                                    const OLIBC_SZHASH *pHash, const char *lineFmt);
/* Appends a section.  1 or more on success; negative on failure (also when it exists). */
ORLO_EXPORT int OLIBCFileAddSection(const char *path, const char *section,
                                    const OLIBC_SZHASH *pHash, const char *lineFmt);
/* Removes a section.  1 when removed, 0 when absent, negative on failure. */
ORLO_EXPORT int OLIBCFileRemoveSection(const char *path, const char *section);
/* Flat files.  GetKeyValue: the value's length (0 or more) when found, -1 when absent or on
 * failure (OLIBCErrGet tells which), and a value that does not fit is refused, never cut. */
ORLO_EXPORT int OLIBCFileGetKeyValue(const char *path, const char *key, char *buf, size_t size);
/* Sets key with lineFmt ("%s=%s\n" or "%s=\"%s\"\n"), replacing its line or appending one;
 * creates the file when missing.  0 or negative. */
ORLO_EXPORT int OLIBCFileSetKeyValue(const char *path, const char *key, const char *value,
                                     const char *lineFmt);
/* Reads every key of a flat file into *ppHash (allocating it when NULL).  Count or negative. */
ORLO_EXPORT int OLIBCFileGetKeys(const char *path, POLIBC_SZHASH *ppHash);
/* 1 when key holds exactly value, 0 when not (or absent), negative on failure. */
ORLO_EXPORT int OLIBCFileCheckKeyValue(const char *path, const char *key, const char *value);
/* One key of one section. Set: 0 or negative (adds the section when absent).
 * Get: the length when found, -1 when absent or on failure. */
ORLO_EXPORT int OLIBCFileSetSectionValue(const char *path, const char *section, const char *key,
                                         const char *value, const char *lineFmt);
ORLO_EXPORT int OLIBCFileGetSectionValue(const char *path, const char *section, const char *key,
                                         char *buf, size_t size);
/* 1 when the line (without its newline) is a section header "[name]", else 0. */
ORLO_EXPORT int OLIBCIFileIsSection(const char *line, size_t length);

/* ---- Line files: one entry per line, no sections (the snapshot application keys).  A
 * line is what stands before its newline; the last line may lack one.  A missing file
 * counts as an empty one.  Writers replace the file atomically like the section writers
 * and refuse a symbolic link at the path (OLIBC_ERR_FOPEN). ---- */
#define OLIBC_FILE_LINE_MAX 512  /* longest line a writer adds, its newline included */
/* The number (from 1) of the first line equal to line, 0 when none is, negative on failure. */
ORLO_EXPORT int OLIBCFileMatchLineNo(const char *path, const char *line);
/* Appends line and a newline (after a newline when the last line lacks one), creating the
 * file (0644) when missing.  A line holding "\n" or "\r", or longer than
 * OLIBC_FILE_LINE_MAX - 1 bytes, is refused (OLIBC_ERR_BAD_PARAM).  0 or negative. */
ORLO_EXPORT int OLIBCFileAddLine(const char *path, const char *line);
/* Removes every line equal to line.  The number removed (0 leaves the file as it is), or
 * negative. */
ORLO_EXPORT int OLIBCFileRemoveLine(const char *path, const char *line);
/* Appends every line of the file to *ppList (allocating it when NULL), each as it stands
 * with its newline.  The number of lines, or negative (a list allocated here is freed
 * again, one passed in keeps what it held). */
ORLO_EXPORT int OLIBCFileReadLines(const char *path, POLIBC_SZLIST *ppList);

/* ---- Lock files: advisory locks on a file of their own ---- */
/* Creates the lock file (0600, not following symbolic links) if needed and locks it,
 * shared or exclusive, waiting up to timeoutSec seconds (-1: for ever, 0: not at all).
 * Returns 1 with *pHandle set when held, 0 otherwise (*pHandle stays -1). */
ORLO_EXPORT int OLIBCFileLockTimeByFile(const char *lockPath, int exclusive, int timeoutSec, int *pHandle);
/* Releases the lock and closes the handle.  0 or -1. */
ORLO_EXPORT int OLIBCFileUnlockByFile(int handle);

/* ---- Processes, started without a shell; program paths are mapped like files ---- */
/* Runs path with up to four arguments (the list ends at the first NULL) and waits.
 * Returns the exit status (0..255), or negative when it could not be run or was killed. */
ORLO_EXPORT int OLIBCExec(const char *path, const char *arg1, const char *arg2,
                          const char *arg3, const char *arg4);
/* Runs argv (argv[0] is the program path, the array ends with NULL) and waits.  As OLIBCExec. */
ORLO_EXPORT int OLIBCExecv(const char *const argv[]);
/* Starts path with the NULL-terminated arguments that follow mode and returns a stream on
 * its standard output ("r") or input ("w"); NULL on failure. */
ORLO_EXPORT FILE *OLIBCPopen(const char *path, const char *mode, ...);
ORLO_EXPORT FILE *OLIBCPopenv(const char *const argv[], const char *mode);
/* Closes a stream of OLIBCPopen and waits: the exit status, or negative. */
ORLO_EXPORT int OLIBCPclose(FILE *stream);
/* Forks a child that nobody needs to wait for (it is reaped automatically).
 * Returns 0 in the child, the child's pid in the parent, -1 on failure. */
ORLO_EXPORT pid_t OLIBCProcForkChildNoWait(void);

/* ---- Cipher for stored secrets (CHAP passwords): AES-256-GCM with a fresh random 96-bit
 * nonce per call and a 128-bit tag, under the appliance's own 32-byte key.  The key lives in
 * OLIBC_CRYPT_KEY_PATH (mode 0600, owner only); it is made from the system's random source
 * on first use, written to a temporary file and renamed into place under the lock file
 * OLIBC_CRYPT_KEY_LOCK_PATH, so concurrent first users all end up with the same key.
 *
 * Stored form: "~" followed by nonce|ciphertext|tag in unpadded base64url ("A-Z a-z 0-9 - _"),
 * safe as a section-file value.  Its length is 1 + ceil((28 + n) * 4 / 3) for a secret of n
 * bytes, so a secret of up to OLIBC_CRYPT_PLAIN_MAX (18) bytes fits a 64-byte field; a longer
 * one is refused (OLIBC_ERR_TOO_LONG), never cut.  An empty secret is stored as "".
 * Decrypting a stored form that was changed, or made under another key, fails
 * (OLIBC_ERR_CRYPT).  Both return 0, or -1 with the error state set.  Thread-safe. ---- */
#define OLIBC_CRYPT_KEY_PATH "/usr/orlo/etc/.iscsi_secret.key"
#define OLIBC_CRYPT_KEY_LOCK_PATH "/tmp/.iscsi_secret.key.lock"
#define OLIBC_CRYPT_PLAIN_MAX 18   /* longest secret whose stored form fits 64 bytes */
#define OLIBC_CRYPT_STORED_MAX 63  /* longest stored form (characters) */
/* Enciphers the NUL-terminated plain into out (outSize bytes, the stored form and its NUL). */
ORLO_EXPORT int OLIBCCryptSzEncrypt(const char *plain, char *out, size_t outSize);
/* Deciphers a stored form into out (outSize bytes, the secret and its NUL). */
ORLO_EXPORT int OLIBCCryptSzDecrypt(const char *stored, char *out, size_t outSize);

/* ---- Plug-ins: executables that other packages install to hear of (and veto) the
 * library's operations.  For category "lun" and action "lun_create" they live in
 * /usr/orlo/plugins/lun/lun_create/ and run in name order, each as
 *     <plugin> <event> <action>
 * with a JSON description of the object on standard input.  A plug-in that exits
 * non-zero, is killed, or runs longer than OLIB_PLUGIN_TIMEOUT seconds has failed. ---- */
#define OLIB_PLUGIN_EVENT_PRE  4
#define OLIB_PLUGIN_EVENT_POST 5
#define OLIB_PLUGIN_TIMEOUT    60
typedef struct _tag_OLIB_PLUGIN OLIB_PLUGIN, *POLIB_PLUGIN;
/* Collects the plug-ins of category/action.  0, or -1 on bad arguments or allocation. */
ORLO_EXPORT int OLIBPluginSDKInit(const char *category, const char *action, POLIB_PLUGIN *pHandle);
/* 1 when handle came from a successful OLIBPluginSDKInit, else 0. */
ORLO_EXPORT int OLIBPluginHasInit(const OLIB_PLUGIN *handle);
/* Runs every plug-in for event with json on its input.  The pre-step stops at the first
 * failure; other events run them all.  0 when all succeeded, else -1 (OLIBC_ERR_EXEC). */
ORLO_EXPORT int OLIBPluginRun(POLIB_PLUGIN handle, int event, const char *json);
/* The number of plug-ins found (0 or more). */
ORLO_EXPORT int OLIBPluginCount(const OLIB_PLUGIN *handle);
ORLO_EXPORT void OLIBPluginExit(POLIB_PLUGIN handle);

/* ---- Network interfaces: the appliance's interfaces and their addresses, as the
 * kernel reports them now (getifaddrs).  Loopback interfaces are never listed. ---- */
#define NUM_MAXIFACES 32            /* most interfaces or addresses one query returns */
#define OLIB_NET_IFNAME_SIZE 16     /* IFNAMSIZ */
/* Kinds of interfaces a query takes in besides the ordinary (physical, bond, bridge,
 * VLAN) ones.  PPP means point-to-point links; this platform keeps the HA data link as
 * an ordinary interface, so NIC_HA_DATA adds nothing of its own. */
typedef enum {
    NIC_PHYSICAL = 0x0,
    NIC_LOGICAL_PPP = 0x1,
    NIC_HA_DATA = 0x2
} ORLONICENUM;
/* Interface flags. */
#define OLIB_NET_IF_UP 0x1          /* administratively up */
#define OLIB_NET_IF_LINK 0x2        /* up with a carrier (running) */
#define OLIB_NET_IF_STATIC 0x4      /* up with an IPv4 address but no carrier: an address
                                       kept without a link was configured, not leased */
typedef struct _tag_OLIB_NET_IFINFO {
    char szName[OLIB_NET_IFNAME_SIZE];  /* "eth0" */
    char szIP[16];                      /* first IPv4 address, dotted; "" when none */
    char szMask[16];                    /* its netmask; "" when none */
    int flags;                          /* OLIB_NET_IF_* */
    int ifIndex;                        /* the kernel's interface index */
} OLIB_NET_IFINFO;
/* Fills pInfo[0..max) with the interfaces of the kinds asked for, in the kernel's
 * order: their number (0 or more), or -1 with the error state set (bad arguments
 * OLIBC_ERR_BAD_PARAM, a failed query OLIBC_ERR_IO).  Interfaces beyond max are left
 * out. */
ORLO_EXPORT int OLIBNetGetInterfaceInfo(OLIB_NET_IFINFO *pInfo, int max, ORLONICENUM kinds);

/* One IPv6 address of an interface. */
typedef struct _tag_ORLO_V6_IP {
    char szIP[46];      /* INET6_ADDRSTRLEN, without scope */
    int scopeId;        /* interface index for link-local addresses, else 0 */
    int prefixLen;      /* 0..128 */
} ORLO_V6_IP;
/* Fills pIP[0..max) with the IPv6 addresses of interface ifname: their number (0 or
 * more, 0 also for an unknown interface), or -1 with the error state set. */
ORLO_EXPORT int ORLOLnxV6IPGet(const char *ifname, ORLO_V6_IP *pIP, int max);

ORLO_EXTERN_C_END

#endif
