/*
 * orlocomm: the messaging engine of the appliance.
 *
 * Named applications (services) on one appliance, and engines on different appliances,
 * exchange framed messages through the engine process (orlocommd).  Everything that crosses
 * a pipe or a socket is a packet: a 32-byte frame header followed by one payload, either a
 * control message (fixed layout, chosen by its first byte, the command code) or a data
 * message that carries up to 4012 bytes of an application between two service UUIDs.
 *
 * An application joins with CreateOrloComm(name), connects to a service with
 * OrloCommConnect(handle, host, service), which yields a route index, sends with
 * CommSendMessage and receives with CommRecvMessage (or envelopes, CommRecvEvlp and
 * CommRetEvlp to answer), and leaves with DestroyOrloComm.  Applications reach their engine
 * through FIFOs under /tmp (mapped under ORLO_SYSROOT by the OS seam); engines reach each
 * other over TCP port 3262.
 *
 * All integers are in the host's native byte order on the wire; IPv4 addresses are held
 * in network order (first octet first in memory).  Functions return 0 (or a count) on
 * success and -1 (or NULL) on failure, and log every failure once in the engine's own
 * format ("<file>:<line> orlocomm: ...") at LOG_ERR; progress lines go out at LOG_INFO.
 *
 * Threads: an application may send from one thread while another receives; connect and
 * disconnect are serialised by mCommMutex.  The engine runs its pipe dispatch loop on one
 * thread and one thread per accepted TCP connection.
 */
#ifndef ORLOCOMM_H
#define ORLOCOMM_H

#include <netinet/in.h>
#include <pthread.h>
#include <stddef.h>
#include <stdint.h>
#include <sys/types.h>
#include <time.h>

#include "orlo_export.h"

ORLO_EXTERN_C_BEGIN

/* ---- Sizes and limits ---- */
#define ORLOCOMM_PORT 3262              /* every engine listens here */
#define ORLOCOMM_HEADER_SIZE 32         /* frame header before every payload */
#define ORLOCOMM_MAGIC_SIZE 8
#define ORLOCOMM_NAME_SIZE 32           /* service names, host names, UUIDs (31 + NUL) */
#define ORLOCOMM_MSG_BUF_SIZE 4096      /* a data message buffer, and the largest message */
#define ORLOCOMM_DATA_OFFSET 84         /* application data inside a data message */
#define MAX_DATA_PACKETS 4012           /* most application bytes in one data message */
#define ORLOCOMM_MAX_ROUTE_RULES 256    /* route indexes 0..255 per application */
#define ORLOCOMM_MAX_HOST_IPS 32        /* addresses kept per host */
#define ORLOCOMM_MAJOR 1
#define ORLOCOMM_MINOR 1

/* ---- Command codes ---- */
#define ORLOCOMM_OP_ABROKEN 0x01
#define ORLOCOMM_OP_CONN 0x10
#define ORLOCOMM_OP_CONNACK 0x11
#define ORLOCOMM_OP_RCONN 0x12
#define ORLOCOMM_OP_RCONNACK 0x13
#define ORLOCOMM_OP_REGISTER 0x14
#define ORLOCOMM_OP_REGISACK 0x15
#define ORLOCOMM_OP_UNREGISTER 0x16
#define ORLOCOMM_OP_UNREGISACK 0x17
#define ORLOCOMM_OP_GETAPPIP 0x18
#define ORLOCOMM_OP_GETAPPIPACK 0x19
#define ORLOCOMM_OP_SENDMSG 0x20
#define ORLOCOMM_OP_RECVMSG 0x21
#define ORLOCOMM_OP_BIND 0x30
#define ORLOCOMM_OP_BOND 0x31
#define ORLOCOMM_OP_BAND 0x32
#define ORLOCOMM_OP_UBIND 0x33
#define ORLOCOMM_OP_UBOND 0x34
#define ORLOCOMM_OP_UBAND 0x35
#define ORLOCOMM_OP_HOSTNTY 0x36
#define ORLOCOMM_OP_HOSTIPS 0x37
#define ORLOCOMM_OP_PING 0x40
#define ORLOCOMM_OP_PONG 0x41
#define ORLOCOMM_OP_SSTOP 0x50
#define ORLOCOMM_OP_EXCEPTION 0xFF

/* Pong statuses: where a ping got to. */
#define ORLOCOMM_PONG_LOCAL_FOUND 0x1022     /* same host, the service exists */
#define ORLOCOMM_PONG_LOCAL_MISSING 0x1020   /* same host, no such service */
#define ORLOCOMM_PONG_REMOTE_FOUND 0x2022    /* answered by the target's host: exists */
#define ORLOCOMM_PONG_REMOTE_MISSING 0x2020  /* answered by the target's host: no such service */
#define ORLOCOMM_PONG_UNREACHABLE 0x2000     /* the target's host could not be reached */

/* ConnAck / RConnAck statuses of the engines' hand-shake. */
#define ORLOCOMM_CONNACK_ACCEPTED 0   /* the host is registered and its channel open */
#define ORLOCOMM_CONNACK_MALFORMED 1  /* the Conn was not a well-formed 212-byte message */
#define ORLOCOMM_CONNACK_SELF 2       /* the Conn claims to come from this very host */
#define ORLOCOMM_CONNACK_FULL 3       /* no room for another remote host */
#define ORLOCOMM_CONNACK_FAILED 4     /* the host could not be registered */

/* Route kinds (source host type * 16 + destination host type). */
#define ORLOCOMM_ROUTE_LOCAL_LOCAL 17
#define ORLOCOMM_ROUTE_LOCAL_REMOTE 18
#define ORLOCOMM_ROUTE_REMOTE_LOCAL 33
#define ORLOCOMM_ROUTE_REMOTE_REMOTE 34

#define ORLOCOMM_HOST_LOCAL 1
#define ORLOCOMM_HOST_REMOTE 2
#define ORLOCOMM_HOST_UNKNOWN 3
#define ORLOCOMM_APP_LOCAL 1
#define ORLOCOMM_APP_REMOTE 2

/* Channel ends and kinds. */
#define ORLOCOMM_SERVER_END 1
#define ORLOCOMM_CLIENT_END 2
#define ORLOCOMM_CH_INTERNAL 1
#define ORLOCOMM_CH_EXTERNAL_IN 2
#define ORLOCOMM_CH_EXTERNAL_OUT 3
#define ORLOCOMM_CH_PROCESS 4

/* Transport types. */
#define ORLOCOMM_TRANSPORT_SOCKET 1
#define ORLOCOMM_TRANSPORT_PIPE 2
#define ORLOCOMM_TRANSPORT_BASE 3
/* Constructing a pipe channel with this type makes it the engine's message server. */
#define ORLOCOMM_PIPE_TYPE_MSG_SERVER 16
#define ORLOCOMM_OWNER_CTL_SERVER (-2)
#define ORLOCOMM_OWNER_MSG_SERVER (-1)

/* Appliance paths (mapped under ORLO_SYSROOT). */
#define ORLOCOMM_PIPE_SVR_CTL_REQ "/tmp/orlocomm_pipe_svr_ctl_req"
#define ORLOCOMM_PIPE_SVR_CTL_REP "/tmp/orlocomm_pipe_svr_ctl_rep"
#define ORLOCOMM_PIPE_SVR_MSG_REQ "/tmp/orlocomm_pipe_svr_msg_req"
#define ORLOCOMM_PIPE_SVR_MSG_REP "/tmp/orlocomm_pipe_svr_msg_rep"
#define ORLOCOMM_PIPE_REQ_FMT "/tmp/orlocomm_pipe_req_%d"
#define ORLOCOMM_PIPE_REP_FMT "/tmp/orlocomm_pipe_rep_%d"
#define ORLOCOMM_FIFO_MODE 0620
#define ORLOCOMM_COUNT_FILE "/tmp/orlocomm_count"
#define ORLOCOMM_COUNT_LOCK "/tmp/orlocomm_count_file.lock"
#define ORLOCOMM_COUNT_KEY "local_orlocomm_count"
#define ORLOCOMM_PID_FILE "/var/run/iscsi_snapshot_comm_core.pid"

/* Names of the engine's internal channels. */
#define ORLOCOMM_CH_PRQRX "PRqRx"
#define ORLOCOMM_CH_PRQSN "PRqSn"
#define ORLOCOMM_CH_SRQLN "SRqLn"

/* ---- Wire layouts ---- */

/* Frame header: magic, zero, payload length, zero. */
typedef struct _tag_ORLOCOMM_FRAME_HEADER {
    uint8_t magic[ORLOCOMM_MAGIC_SIZE];
    uint8_t zero1[16];
    uint32_t length;
    uint32_t zero2;
} ORLOCOMM_FRAME_HEADER;

/* A service: name, owner (process id or a chosen number), UUID "<name>-<owner>". */
typedef struct _tag_ServiceID {
    char service_name[ORLOCOMM_NAME_SIZE];
    int32_t owner;
    char uuid[ORLOCOMM_NAME_SIZE];
} ServiceID;

/* The common layout of the routed codes (212 bytes). */
typedef struct _tag_ORLOCOMM_ROUTE_MSG {
    uint8_t opcode;
    uint8_t major;
    uint8_t minor;
    uint8_t reserved;
    uint32_t src_ip;
    char src_host[ORLOCOMM_NAME_SIZE];
    uint32_t dst_ip;
    char dst_host[ORLOCOMM_NAME_SIZE];
    ServiceID src_id;
    ServiceID dst_id;
} ORLOCOMM_ROUTE_MSG;

/* ConnAck, RConnAck, Ping, Pong (216 bytes). */
typedef struct _tag_ORLOCOMM_STATUS_MSG {
    ORLOCOMM_ROUTE_MSG route;
    int32_t status;
} ORLOCOMM_STATUS_MSG;

/* HostIPs: 220 + 4 * count bytes. */
typedef struct _tag_ORLOCOMM_HOSTIPS_MSG {
    ORLOCOMM_ROUTE_MSG route;
    uint32_t size;
    uint32_t count;
    uint32_t ips[];
} ORLOCOMM_HOSTIPS_MSG;

/* Register (40 bytes). */
typedef struct _tag_ORLOCOMM_REGISTER_MSG {
    uint8_t opcode;
    uint8_t major;
    uint8_t minor;
    uint8_t reserved;
    char service_name[ORLOCOMM_NAME_SIZE];
    int32_t owner;
} ORLOCOMM_REGISTER_MSG;

/* Regisack, UnRegister, UnRegisack (72 bytes). */
typedef struct _tag_ORLOCOMM_SERVICE_MSG {
    uint8_t opcode;
    uint8_t major;
    uint8_t minor;
    uint8_t reserved;
    ServiceID id;
} ORLOCOMM_SERVICE_MSG;

/* GetAppIP (68 bytes). */
typedef struct _tag_ORLOCOMM_GETAPPIP_MSG {
    uint8_t opcode;
    uint8_t major;
    uint8_t minor;
    uint8_t reserved;
    char from_uuid[ORLOCOMM_NAME_SIZE];
    char wanted_uuid[ORLOCOMM_NAME_SIZE];
} ORLOCOMM_GETAPPIP_MSG;

/* GetAppIPAck (12 bytes). */
typedef struct _tag_ORLOCOMM_GETAPPIPACK_MSG {
    uint8_t opcode;
    uint8_t major;
    uint8_t minor;
    uint8_t reserved;
    uint32_t ip;
    int32_t found;
} ORLOCOMM_GETAPPIPACK_MSG;

/* SendMsg / RecvMsg (a 4096-byte buffer; data length + 84 bytes travel). */
typedef struct _tag_ORLOCOMM_DATA_MSG {
    uint8_t opcode;
    uint8_t major;
    uint8_t minor;
    uint8_t reserved;
    char from_uuid[ORLOCOMM_NAME_SIZE];
    char to_uuid[ORLOCOMM_NAME_SIZE];
    uint8_t zero1[8];
    uint32_t length;
    uint32_t zero2;
    uint8_t data[MAX_DATA_PACKETS];
} ORLOCOMM_DATA_MSG;

/* ---- Command tables ---- */
typedef struct _tag_ORLOCOMM_CMD_PATTERN {
    int32_t code;      /* 0xFF is stored as -1 */
    const char *name;  /* NULL ends the table */
    int32_t size;      /* message size in bytes, 0 when variable */
} ORLOCOMM_CMD_PATTERN;
ORLO_EXPORT extern const ORLOCOMM_CMD_PATTERN pCommCmdPatterns[];

/* The backup protocol's JSON commands.  A handler answers one request; the handlers are
 * provided by the backup protocol and a row whose handler is not linked in is skipped. */
typedef int (*ORLOCOMM_PROT_HANDLER)(void *comm, void *envelope, void *request, void **reply);
typedef struct _tag_ORLOCOMM_PROT_PATTERN {
    int32_t code;
    const char *name;
    ORLOCOMM_PROT_HANDLER handler;
} ORLOCOMM_PROT_PATTERN;
ORLO_EXPORT extern const ORLOCOMM_PROT_PATTERN pCmdPatterns[];

/* ---- Lists ---- */
typedef struct _tag_ORLOCOMM_LINK {
    struct _tag_ORLOCOMM_LINK *next;
    struct _tag_ORLOCOMM_LINK *prev;
} ORLOCOMM_LINK;

/* A received or extracted packet.  The links come first so that insque/remque work;
 * a queue is a circular list whose head is a packet of its own. */
typedef struct _tag_ORLOCOMM_CMD_PACKET {
    struct _tag_ORLOCOMM_CMD_PACKET *next;
    struct _tag_ORLOCOMM_CMD_PACKET *prev;
    uint32_t len;
    uint8_t *data;
} ORLOCOMM_CMD_PACKET;

/* ---- Channels ---- */
struct _tag_ORLOCOMM_CHANNEL;
struct _tag_ORLOCOMM_TRANSPORT;

typedef struct _tag_ORLOCOMM_CHANNEL_DESC {
    ORLOCOMM_LINK link;  /* membership in one list of the channel set */
    ServiceID id;        /* the name is the channel's name */
    int32_t end;         /* ORLOCOMM_SERVER_END or ORLOCOMM_CLIENT_END */
    int32_t kind;        /* ORLOCOMM_CH_*, 0 while in no list */
    struct _tag_ORLOCOMM_CHANNEL *channel;
} ORLOCOMM_CHANNEL_DESC;

typedef struct _tag_ORLOCOMM_CHANNEL {
    ORLOCOMM_CHANNEL_DESC *desc;
    void *request;   /* ORLOCOMM_PIPE or ORLOCOMM_SOCKET */
    void *response;
    int32_t has_request;
    int32_t has_response;
    struct _tag_ORLOCOMM_CHANNEL *base;  /* nested channel, or NULL */
    const struct _tag_ORLOCOMM_TRANSPORT *transport;
    int32_t freed;
    int32_t ref_count;
    pthread_mutex_t mutex;       /* freed flag and reference count */
    pthread_mutex_t send_mutex;  /* one writer at a time */
    pthread_mutex_t recv_mutex;  /* one reader at a time */
    int32_t failed;              /* a frame could not be read or written whole */
    struct _tag_ORLOCOMM_CHANNEL *registered;  /* an accepted connection's external-in channel */
} ORLOCOMM_CHANNEL;

typedef int (*ORLOCOMM_WRITE_FN)(void *media, const void *buf, int len);
typedef int (*ORLOCOMM_READ_FN)(void *media, void *buf, int len);

/* A transport: the operations the engine drives every channel with. */
typedef struct _tag_ORLOCOMM_TRANSPORT {
    int32_t type;                                                                     /* 0 */
    ORLOCOMM_CHANNEL *(*construct)(const char *name, int owner, int end, int type);   /* 1 */
    void (*destruct)(ORLOCOMM_CHANNEL *ch);                                           /* 2 */
    int (*start_service)(ORLOCOMM_CHANNEL *ch);                                       /* 3 */
    int (*stop_service)(ORLOCOMM_CHANNEL *ch);                                        /* 4 */
    int (*internal_request)(ORLOCOMM_CHANNEL *ch, const char *addr);                  /* 5 */
    int (*internal_response)(ORLOCOMM_CHANNEL *ch, const char *addr);                 /* 6 */
    int (*internal_request_media)(ORLOCOMM_CHANNEL *ch, void *media);                 /* 7 */
    int (*internal_response_media)(ORLOCOMM_CHANNEL *ch, void *media);                /* 8 */
    int (*external_request)(ORLOCOMM_CHANNEL *ch, const void *msg, int len, void *reply,
                            int size);                                                /* 9 */
    int (*external_response)(ORLOCOMM_CHANNEL *ch, const void *msg, int len);         /* 10 */
    ORLOCOMM_WRITE_FN write;                                                          /* 11 */
    ORLOCOMM_READ_FN read;                                                            /* 12 */
    int (*send_msg)(ORLOCOMM_CHANNEL *ch, const void *msg, int len);                  /* 13 */
    int (*recv_msg)(ORLOCOMM_CHANNEL *ch, void *buf, int size);                       /* 14 */
} ORLOCOMM_TRANSPORT;

ORLO_EXPORT extern const ORLOCOMM_TRANSPORT pipe_channel_transport;
ORLO_EXPORT extern const ORLOCOMM_TRANSPORT socket_channel_transport;
ORLO_EXPORT extern const ORLOCOMM_TRANSPORT base_channel_transport;
ORLO_EXPORT extern const ORLOCOMM_TRANSPORT *const transports[];

/* A pipe medium: one FIFO end. */
typedef struct _tag_ORLOCOMM_PIPE {
    int read_fd;
    int write_fd;
    char path[4096];
    ORLOCOMM_CMD_PACKET queue;
    int32_t server;       /* made the FIFO and reads it (unlinks it when destroyed) */
    int32_t shared;       /* several processes write it: writers flock the FIFO around a frame */
    int32_t read_timeout_ms;  /* how long the rest of a started frame may take */
    int32_t frame_started;    /* a frame has begun: its rest is waited for read_timeout_ms */
    int32_t short_read;       /* the last frame came short (end of file, time-out, error) */
    int32_t rbuf_len;         /* bytes read ahead of the frame being taken */
    int32_t rbuf_off;
    uint8_t rbuf[8192];
} ORLOCOMM_PIPE;

/* A socket medium. */
typedef struct _tag_ORLOCOMM_SOCKET {
    int sock_fd;          /* the listening or connecting socket */
    int conn_fd;          /* the accepted connection (server side), else -1 */
    struct sockaddr_in addr;
    char name[4096];
    time_t last_recv;
    time_t last_send;
    int32_t frame_timeout_ms;
    int32_t frame_started;
    int32_t short_read;
    int32_t rbuf_len;
    int32_t rbuf_off;
    uint8_t rbuf[8192];
} ORLOCOMM_SOCKET;

typedef struct _tag_ORLOCOMM_CHANNEL_SET {
    ORLOCOMM_LINK lists[4];  /* internal, external in, external out, process */
    int32_t counts[4];
    pthread_mutex_t mutex;
} ORLOCOMM_CHANNEL_SET;

/* ---- Applications, rules and hosts ---- */
struct _tag_ORLOCOMM_HOST;

typedef struct _tag_ORLOCOMM_APP {
    ServiceID id;
    ORLOCOMM_CHANNEL *channel;
    int32_t type;  /* ORLOCOMM_APP_LOCAL or ORLOCOMM_APP_REMOTE */
    struct _tag_ORLOCOMM_HOST *host;
    ORLOCOMM_LINK host_link;
    int32_t rule_count;
    ORLOCOMM_LINK rules;
    ORLOCOMM_CMD_PACKET control_queue;
    int32_t control_count;
    ORLOCOMM_CMD_PACKET data_queue;
    int32_t data_count;
    pthread_mutex_t queue_mutex;
    pthread_mutex_t queue_mutex2;
    int32_t to_be_deleted;
    int32_t ref_count;
    pthread_mutex_t mutex;
    /* kept by the library */
    int32_t comm_flags;
    pid_t engine_pid;
    int32_t stopped;
    int64_t last_drain_ms;
} ORLOCOMM_APP;

typedef struct _tag_ORLOCOMM_RULE {
    ORLOCOMM_LINK link;
    ORLOCOMM_APP *owner;
    ORLOCOMM_APP *peer;
    int32_t index;
} ORLOCOMM_RULE;

typedef struct _tag_ORLOCOMM_HOST {
    ORLOCOMM_LINK link;
    int32_t type;
    uint32_t ips[ORLOCOMM_MAX_HOST_IPS];
    int32_t ip_count;
    char name[ORLOCOMM_NAME_SIZE];
    int32_t app_count;
    ORLOCOMM_LINK apps;
    pthread_mutex_t mutex;
} ORLOCOMM_HOST;

typedef struct _tag_ORLOCOMM_HOST_SET {
    ORLOCOMM_LINK hosts;
    int32_t count;
    int32_t type;
    pthread_mutex_t mutex;
} ORLOCOMM_HOST_SET;

/* Handles. */
typedef struct _tag_ORLOCOMM {
    ORLOCOMM_APP *app;
} ORLOCOMM, *PORLOCOMM;
typedef struct _tag_ORLOCOMM_EVLP {
    uint8_t *buf;  /* a 4096-byte data message */
} ORLOCOMM_EVLP, *PORLOCOMM_EVLP;
typedef struct _tag_ORLOCOMM_ENG {
    ORLOCOMM_CHANNEL *prqrx;
    ORLOCOMM_CHANNEL *prqsn;
    ORLOCOMM_CHANNEL *srqln;
} ORLOCOMM_ENG;

/* ---- Globals ---- */
ORLO_EXPORT extern ORLOCOMM_CHANNEL_SET *pChannelSet;
ORLO_EXPORT extern ORLOCOMM_HOST_SET *pLocalHostSet;
ORLO_EXPORT extern ORLOCOMM_HOST_SET *pRemoteHostSet;
ORLO_EXPORT extern char gszLocalHostName[36];
ORLO_EXPORT extern char gszLocalActiveIP[64];
ORLO_EXPORT extern pthread_mutex_t mCommMutex;
ORLO_EXPORT extern pthread_once_t once_block;

/* The priorities (a syslog mask, LOG_UPTO(...)) of the engine's lines that are formatted
 * and logged at all; all of them by default.  A program that masks its info lines sets this
 * too, so that masked lines cost nothing. */
ORLO_EXPORT void OrloCommSetLogMask(int mask);

/* ---- Service identifiers (orlocomm_types) ---- */
ORLO_EXPORT int ServiceUUIDGenerate(const char *name, int owner, char *dst, size_t n);
ORLO_EXPORT int ServiceIDGenerateUUID(ServiceID *id);
ORLO_EXPORT ServiceID *GenServiceID(const char *name, int owner, const char *uuid);
ORLO_EXPORT int CompareUUID(const char *a, const char *b);
ORLO_EXPORT int CompareSID(const ServiceID *a, const ServiceID *b);

/* ---- Frames (orlocomm_packet_cmd) ---- */
ORLO_EXPORT int CreatePacket(uint8_t **out, const void *data, int len);
ORLO_EXPORT int PacketWrite(void *channel, ORLOCOMM_WRITE_FN write, const void *data, int len);
ORLO_EXPORT int PacketRead(void *channel, ORLOCOMM_READ_FN read, void *buf, int size);
ORLO_EXPORT ORLOCOMM_CMD_PACKET *CreateCmdPacket(const void *data, int len);
ORLO_EXPORT void FreeCmdPacket(ORLOCOMM_CMD_PACKET *p);
ORLO_EXPORT int ExtractPacket(const void *buf, int len, ORLOCOMM_CMD_PACKET *queue);

/* ---- Data messages and the command table (orlocomm_message) ---- */
ORLO_EXPORT uint8_t *CreateSendDataPacket(uint8_t *buf, const char *from_uuid, const char *to_uuid,
                                          const void *data, int len);
ORLO_EXPORT uint8_t *CreateRecvDataPacket(uint8_t *buf, const char *from_uuid, const char *to_uuid,
                                          const void *data, int len);
ORLO_EXPORT int ExtractFromUUIDByDataPacket(const void *msg, char *out);
ORLO_EXPORT int ExtractToUUIDByDataPacket(const void *msg, char *out);
ORLO_EXPORT int FillInFromUUID(void *msg, const char *uuid);
ORLO_EXPORT int FillInToUUID(void *msg, const char *uuid);
ORLO_EXPORT const char *GetCommCmdNameExt(const void *msg);
ORLO_EXPORT int GetCommCmdDetail(const void *msg);
ORLO_EXPORT int IsControlMsg(const void *msg);

/* ---- Control message builders (orlocomm_channel_control); free() the result ---- */
ORLO_EXPORT uint8_t *CreateConnectV4Msg(const ORLOCOMM_HOST *local_host, const ORLOCOMM_HOST *remote_host);
ORLO_EXPORT uint8_t *CreateRConnectV4Msg(const ORLOCOMM_HOST *host_a, const ORLOCOMM_HOST *host_b);
ORLO_EXPORT uint8_t *CreateConnAckMsg(const uint8_t *conn, uint32_t local_ip, const char *local_host,
                                      int status);
ORLO_EXPORT uint8_t *CreateRConnAckMsg(const uint8_t *rconn, int status);
ORLO_EXPORT uint8_t *CreateRegistryMsg(const ORLOCOMM_APP *app);
ORLO_EXPORT uint8_t *CreateRegisAckMsg(const ORLOCOMM_APP *app);
ORLO_EXPORT uint8_t *CreateURegistryMsg(const ORLOCOMM_APP *app);
ORLO_EXPORT uint8_t *CreateURegisAckMsg(const ORLOCOMM_APP *app);
ORLO_EXPORT uint8_t *CreateGetAppIpMsg(const ORLOCOMM_APP *asking_app, const char *wanted_uuid);
ORLO_EXPORT uint8_t *CreateGetAppIpAckMsg(void);
ORLO_EXPORT uint8_t *CreateBindServiceMsg(const ORLOCOMM_APP *from_app, const ORLOCOMM_APP *to_app);
ORLO_EXPORT uint8_t *CreateBondServiceMsg(const ORLOCOMM_APP *from_app, const ORLOCOMM_APP *to_app);
ORLO_EXPORT uint8_t *CreateBandServiceMsgEx(const uint32_t *from_ip, const char *from_host,
                                            const ServiceID *from_id, const uint32_t *to_ip,
                                            const char *to_host, const ServiceID *to_id);
ORLO_EXPORT uint8_t *CreateUBindServiceMsg(const ORLOCOMM_APP *from_app, const ORLOCOMM_APP *to_app);
ORLO_EXPORT uint8_t *CreateUBondServiceMsg(const ORLOCOMM_APP *from_app, const ORLOCOMM_APP *to_app);
ORLO_EXPORT uint8_t *CreateUBandServiceMsgEx(const uint32_t *from_ip, const char *from_host,
                                             const ServiceID *from_id, const uint32_t *to_ip,
                                             const char *to_host, const ServiceID *to_id);
ORLO_EXPORT uint8_t *CreateHostNotifyMsg(const uint32_t *from_ip, const char *from_host, const uint32_t *to_ip,
                                         const char *to_host);
ORLO_EXPORT uint8_t *CreateHostNotIPsMsg(const uint32_t *from_ip, const char *from_host, const uint32_t *to_ip,
                                         const char *to_host, const ORLOCOMM_HOST *host);
ORLO_EXPORT uint8_t *CreatePingServiceMsg(const ORLOCOMM_APP *app, const ORLOCOMM_APP *target_app);
ORLO_EXPORT uint8_t *CreatePongServiceMsg(const uint32_t *from_ip, const char *from_host,
                                          const ServiceID *from_id, const uint32_t *to_ip,
                                          const char *to_host, const ServiceID *to_id, int status);
ORLO_EXPORT uint8_t *CreateAppBroken(const uint32_t *ip, const ORLOCOMM_APP *app);
ORLO_EXPORT uint8_t *CreateServiceNotifySerialServiceMsg(const uint32_t *ip, const ServiceID *id, int code);
ORLO_EXPORT uint8_t *CreateServicePipeServerStop(void);
ORLO_EXPORT uint8_t *CreateRejectRouteMsg(const void *msg);

/* ---- Route indexes (orlocomm_routing) ---- */
ORLO_EXPORT ORLOCOMM_RULE *CreateRuleItem(ORLOCOMM_APP *app, ORLOCOMM_APP *peer_app);
ORLO_EXPORT int GetMsgRouteKind(const void *msg);

/* ---- Channel set (orlocomm_channel) ---- */
ORLO_EXPORT int InitChannelSet(void);
ORLO_EXPORT int DestroyChannelSet(ORLOCOMM_CHANNEL_SET *set);
ORLO_EXPORT int AddInternalChannel(ORLOCOMM_CHANNEL_SET *set, ORLOCOMM_CHANNEL *ch);
ORLO_EXPORT int AddExternalInChannel(ORLOCOMM_CHANNEL_SET *set, ORLOCOMM_CHANNEL *ch);
ORLO_EXPORT int AddExternalOutChannel(ORLOCOMM_CHANNEL_SET *set, ORLOCOMM_CHANNEL *ch);
ORLO_EXPORT int AddProcessChannel(ORLOCOMM_CHANNEL_SET *set, ORLOCOMM_CHANNEL *ch);
ORLO_EXPORT int RemoveChannel(ORLOCOMM_CHANNEL_SET *set, ORLOCOMM_CHANNEL *ch);
ORLO_EXPORT ORLOCOMM_CHANNEL *GetInternalChannel(ORLOCOMM_CHANNEL_SET *set, const char *name);
ORLO_EXPORT ORLOCOMM_CHANNEL *GetExternalInChannel(ORLOCOMM_CHANNEL_SET *set, const char *name);
ORLO_EXPORT ORLOCOMM_CHANNEL *GetExternalOutChannel(ORLOCOMM_CHANNEL_SET *set, const char *name);
ORLO_EXPORT ORLOCOMM_CHANNEL *GetProcessChannel(ORLOCOMM_CHANNEL_SET *set, const char *name);
ORLO_EXPORT ORLOCOMM_CHANNEL *GetExternalOutChannelByUUID(ORLOCOMM_CHANNEL_SET *set, const char *uuid);
ORLO_EXPORT ORLOCOMM_CHANNEL *GetProcessChannelByUUID(ORLOCOMM_CHANNEL_SET *set, const char *uuid);
ORLO_EXPORT int ListExternalInChannel(ORLOCOMM_CHANNEL_SET *set);
ORLO_EXPORT int ListExternalOutChannel(ORLOCOMM_CHANNEL_SET *set);
ORLO_EXPORT int ListInternalChannel(ORLOCOMM_CHANNEL_SET *set);
ORLO_EXPORT int ListProcessChannel(ORLOCOMM_CHANNEL_SET *set);
ORLO_EXPORT ORLOCOMM_CHANNEL *GetExternalInChannelByIPV4(uint32_t ip);
ORLO_EXPORT ORLOCOMM_CHANNEL *GetExternalInChannelByHostName(const char *host);
ORLO_EXPORT ORLOCOMM_CHANNEL *GetExternalOutChannelByHostName(const char *host);
ORLO_EXPORT int ChannelBroadCast(ORLOCOMM_CHANNEL_SET *set, const void *msg, int len);
ORLO_EXPORT void ChannelGet(ORLOCOMM_CHANNEL *ch);
ORLO_EXPORT void ChannelPut(ORLOCOMM_CHANNEL *ch);
ORLO_EXPORT void ChannelFree(ORLOCOMM_CHANNEL *ch);
ORLO_EXPORT const char *GetChannelServiceName(const ORLOCOMM_CHANNEL *ch);
ORLO_EXPORT const ORLOCOMM_TRANSPORT *GetTransportByType(int type);

/* ---- Pipe transport (orlocomm_channel_pipe) ---- */
ORLO_EXPORT ORLOCOMM_CHANNEL *orlocomm_pipe_construct(const char *name, int owner, int end, int type);
ORLO_EXPORT void orlocomm_pipe_destruct(ORLOCOMM_CHANNEL *ch);
ORLO_EXPORT int orlocomm_pipe_stop_service(ORLOCOMM_CHANNEL *ch);
ORLO_EXPORT int orlocomm_pipe_internal_request(ORLOCOMM_CHANNEL *ch, const char *addr);
ORLO_EXPORT int orlocomm_pipe_internal_response(ORLOCOMM_CHANNEL *ch, const char *addr);
ORLO_EXPORT int orlocomm_pipe_internal_request_media(ORLOCOMM_CHANNEL *ch, void *media);
ORLO_EXPORT int orlocomm_pipe_internal_response_media(ORLOCOMM_CHANNEL *ch, void *media);
ORLO_EXPORT int orlocomm_pipe_write(void *media, const void *buf, int len);
ORLO_EXPORT int orlocomm_pipe_read(void *media, void *buf, int len);
ORLO_EXPORT int GetPipePath(int owner, int request, char *out, size_t size);

/* ---- Socket transport (orlocomm_channel_socket) ---- */
ORLO_EXPORT ORLOCOMM_CHANNEL *orlocomm_socket_construct(const char *name, int owner, int end, int type);
ORLO_EXPORT void orlocomm_socket_destruct(ORLOCOMM_CHANNEL *ch);
ORLO_EXPORT int orlocomm_socket_start_service(ORLOCOMM_CHANNEL *ch);
ORLO_EXPORT int orlocomm_socket_stop_service(ORLOCOMM_CHANNEL *ch);
ORLO_EXPORT int orlocomm_socket_internal_request(ORLOCOMM_CHANNEL *ch, const char *addr);
ORLO_EXPORT int orlocomm_socket_internal_response(ORLOCOMM_CHANNEL *ch, const char *addr);
ORLO_EXPORT int orlocomm_socket_internal_request_media(ORLOCOMM_CHANNEL *ch, void *media);
ORLO_EXPORT int orlocomm_socket_internal_response_media(ORLOCOMM_CHANNEL *ch, void *media);
ORLO_EXPORT int orlocomm_socket_write(void *media, const void *buf, int len);
ORLO_EXPORT int orlocomm_socket_read(void *media, void *buf, int len);
ORLO_EXPORT int IsSocketAlive(const ORLOCOMM_CHANNEL *ch);
ORLO_EXPORT int IsSocketValidOpcode(int code);

/* ---- Engine-side channel helpers (orlocomm_eng_channel_manage) ---- */
ORLO_EXPORT ORLOCOMM_CHANNEL *EngSendMsgToHost(const char *host, const void *msg, int len);
ORLO_EXPORT int GetRouteKind(uint32_t src_ip, const char *src_host, uint32_t dst_ip, const char *dst_host);
ORLO_EXPORT ORLOCOMM_CHANNEL *DupSocketRequestRxChannel(ORLOCOMM_HOST *host, const uint32_t *ips, int count,
                                                        ORLOCOMM_SOCKET *sock);
ORLO_EXPORT int EngConnectHost(uint32_t ip);

/* ---- Applications (orlocomm_app, orlocomm_app_channel_manage) ---- */
ORLO_EXPORT ORLOCOMM_APP *CreateLocalAppServer(const char *name, int pid);
ORLO_EXPORT ORLOCOMM_APP *CreateLocalAppClient(const char *name, int pid);
ORLO_EXPORT ORLOCOMM_APP *CreateRemoteAppServer(const char *name, int pid);
ORLO_EXPORT ORLOCOMM_APP *CreateRemoteAppClient(const char *name, int pid);
ORLO_EXPORT int UpdateAppID(ORLOCOMM_APP *app, const ServiceID *id);
ORLO_EXPORT int BindAppChannel(ORLOCOMM_APP *app, ORLOCOMM_CHANNEL *ch);
ORLO_EXPORT int UnBindAppChannel(ORLOCOMM_APP *app);
ORLO_EXPORT int DetachAppChannel(ORLOCOMM_APP *app);
ORLO_EXPORT int CloseAppChannel(ORLOCOMM_APP *app);
ORLO_EXPORT ORLOCOMM_APP *CreateEngLocalAppServer(const char *name, int pid);
ORLO_EXPORT ORLOCOMM_APP *CreateAppLocalAppServer(const char *name, int pid);
ORLO_EXPORT int AppRegister2Engine(ORLOCOMM_APP *app);
ORLO_EXPORT int AddAppRouteRule(ORLOCOMM_APP *app, ORLOCOMM_APP *peer);
ORLO_EXPORT int RemoveAppRouteRule(ORLOCOMM_APP *app, const ORLOCOMM_APP *peer);
ORLO_EXPORT int RemoveAppRouteRuleByID(ORLOCOMM_APP *app, const ServiceID *id);
ORLO_EXPORT int RemoveAppRouteRuleByFD(ORLOCOMM_APP *app, int index);
ORLO_EXPORT ORLOCOMM_APP *GetFromAppByRule(ORLOCOMM_APP *app, int index);
ORLO_EXPORT ORLOCOMM_APP *GetToAppByRule(ORLOCOMM_APP *app, int index);
ORLO_EXPORT int GetRuleIndexByAppServerUUID(ORLOCOMM_APP *app, const char *peer_uuid);
ORLO_EXPORT int AppSendControl(ORLOCOMM_APP *app, const void *msg, int len);
ORLO_EXPORT int AppSendBlockingControl(ORLOCOMM_APP *app, const void *msg, int len);
ORLO_EXPORT int AppRecvControl(ORLOCOMM_APP *app, void *buf, int size);
typedef int (*ORLOCOMM_ACCEPT_FN)(void *ctx, const void *msg, int len);
ORLO_EXPORT int AppWaitControl(ORLOCOMM_APP *app, void *buf, int size, ORLOCOMM_ACCEPT_FN accept, void *ctx);
ORLO_EXPORT int AppSendMessage(ORLOCOMM_APP *app, int index, const void *data, int len);
ORLO_EXPORT int AppUSendMessage(ORLOCOMM_APP *app, const char *to_uuid, const void *data, int len);
ORLO_EXPORT int AppRecvMessage(ORLOCOMM_APP *app, void *buf, int size);
/* As AppRecvMessage, waiting at most timeout_ms (-1: for ever); 0 when nothing came. */
ORLO_EXPORT int AppRecvMessageTimed(ORLOCOMM_APP *app, void *buf, int size, int timeout_ms);
ORLO_EXPORT int AppRetMessage(ORLOCOMM_APP *app, void *msg, const void *data, int len);
ORLO_EXPORT int AppGetMessageFromFD(ORLOCOMM_APP *app, const void *msg);
ORLO_EXPORT int AppConnect(ORLOCOMM_APP *app, const char *host, const char *service);
ORLO_EXPORT int AppIsConnect(ORLOCOMM_APP *app, const char *host, const char *service);
ORLO_EXPORT int AppDisconnect(ORLOCOMM_APP *app, int index);
ORLO_EXPORT uint32_t AppGetAppIp(ORLOCOMM_APP *app, const char *uuid);
/* Pings service on host and stores the Pong's status: 0, or -1 when no Pong came. */
ORLO_EXPORT int AppPing(ORLOCOMM_APP *app, const char *host, const char *service, int *status);
ORLO_EXPORT int GetAppRefCount(ORLOCOMM_APP *app);
ORLO_EXPORT void AppGet(ORLOCOMM_APP *app);
ORLO_EXPORT void AppPut(ORLOCOMM_APP *app);
ORLO_EXPORT void AppFree(ORLOCOMM_APP *app);
ORLO_EXPORT void AppFreeOnOneAccess(ORLOCOMM_APP *app);
ORLO_EXPORT int ReleaseApp(ORLOCOMM_APP *app, int keep_channel);
ORLO_EXPORT int NotifyAppBrokenToRelatedApp(ORLOCOMM_APP *app);
ORLO_EXPORT int EnCryptBrokenAppFD(int fd);
ORLO_EXPORT int DeCryptBrokenAppFD(int value);

/* ---- Hosts (orlocomm_host) ---- */
ORLO_EXPORT int InitHostSet(void);
ORLO_EXPORT ORLOCOMM_HOST *AddLocalHost(const char *name, const uint32_t *ips, int count);
ORLO_EXPORT ORLOCOMM_HOST *AddRemoteHost(const char *name, const uint32_t *ips, int count);
ORLO_EXPORT int AddRemoteHostIPV4(const char *name, uint32_t ip);
ORLO_EXPORT int AddHostIPv4(ORLOCOMM_HOST *host, uint32_t ip);
ORLO_EXPORT int RemoveHost(ORLOCOMM_HOST *host);
ORLO_EXPORT int UpdateHostName(ORLOCOMM_HOST *host, const char *name);
ORLO_EXPORT ORLOCOMM_HOST *SearchLocalHost(const char *ip);
ORLO_EXPORT ORLOCOMM_HOST *SearchRemoteHost(const char *ip);
ORLO_EXPORT ORLOCOMM_HOST *SearchLocalHostByHostName(const char *name);
ORLO_EXPORT ORLOCOMM_HOST *SearchRemoteHostByHostName(const char *name);
ORLO_EXPORT ORLOCOMM_HOST *SearchLocalHostByIPv4(uint32_t ip);
ORLO_EXPORT ORLOCOMM_HOST *SearchRemoteHostByIPv4(uint32_t ip);
ORLO_EXPORT ORLOCOMM_HOST *SearchHostByChannelName(const char *name);
ORLO_EXPORT int HostBreakByChannelName(const char *name);
ORLO_EXPORT ORLOCOMM_APP *SearchAppInHostByIDExt(ORLOCOMM_HOST *host, const ServiceID *id);
ORLO_EXPORT ORLOCOMM_APP *SearchAppInHostByNameExt(ORLOCOMM_HOST *host, const char *name);
ORLO_EXPORT ORLOCOMM_APP *SearchAppInLocalHostSetByName(const char *name);
ORLO_EXPORT ORLOCOMM_APP *SearchAppInRemoteHostSetByName(const char *name);
ORLO_EXPORT ORLOCOMM_APP *SearchAppInLocalHostSetByID(const ServiceID *id);
ORLO_EXPORT ORLOCOMM_APP *SearchAppInRemoteHostSetByID(const ServiceID *id);
ORLO_EXPORT ORLOCOMM_APP *SearchAppInLocalHostSetByUUID(const char *uuid);
ORLO_EXPORT ORLOCOMM_APP *SearchAppInRemoteHostSetByUUID(const char *uuid);
ORLO_EXPORT int HostAdoptApp(ORLOCOMM_HOST *host, ORLOCOMM_APP *app);
ORLO_EXPORT int HostAbandonApp(ORLOCOMM_HOST *host, ORLOCOMM_APP *app);
ORLO_EXPORT int LocalHostAdoptApp(ORLOCOMM_APP *app);
ORLO_EXPORT int RemoteHostAdoptApp(ORLOCOMM_HOST *host, ORLOCOMM_APP *app);
ORLO_EXPORT int GetHostTypeByIP(const char *ip);
ORLO_EXPORT int GetHostTypeBySIP(uint32_t ip);
ORLO_EXPORT int GetHostTypeByName(const char *name);
ORLO_EXPORT uint32_t GetHostFirstIPV4(const ORLOCOMM_HOST *host);
ORLO_EXPORT uint32_t GetRemoteHostFirstIPV4(const char *name);
ORLO_EXPORT const char *GetLocalHostName(void);
ORLO_EXPORT int ListHostIP(const ORLOCOMM_HOST *host);
ORLO_EXPORT int IsLocalService(const char *host);
ORLO_EXPORT int getrandpid(void);
ORLO_EXPORT int EnumAllAdapterIPs(uint32_t *ips, int max, char *active, size_t active_size);
ORLO_EXPORT int Str2Ipv4(const char *text, uint32_t *ip);
ORLO_EXPORT int Ipv42Str(uint32_t ip, char *out, size_t size);

/* ---- Engine handlers: one per received message.  from is the channel it came on. ---- */
ORLO_EXPORT int HandleAppRegister(const void *msg, int len, ORLOCOMM_CHANNEL *from);
ORLO_EXPORT int HandleAppURegister(const void *msg, int len, ORLOCOMM_CHANNEL *from);
ORLO_EXPORT int HandleAppGetAppIp(const void *msg, int len, ORLOCOMM_CHANNEL *from);
ORLO_EXPORT int HandleConnectV4(const void *msg, int len, ORLOCOMM_CHANNEL *from);
ORLO_EXPORT int HandleRConnectV4(const void *msg, int len, ORLOCOMM_CHANNEL *from);
ORLO_EXPORT int HandleHostNotify(const void *msg, int len, ORLOCOMM_CHANNEL *from);
ORLO_EXPORT int HandleHostIPs(const void *msg, int len, ORLOCOMM_CHANNEL *from);
ORLO_EXPORT int HandleSendMsg(const void *msg, int len, ORLOCOMM_CHANNEL *from);
ORLO_EXPORT int HandleRecvMsg(const void *msg, int len, ORLOCOMM_CHANNEL *from);
ORLO_EXPORT int HandleBindMsg(const void *msg, int len, ORLOCOMM_CHANNEL *from);
ORLO_EXPORT int HandleBondMsg(const void *msg, int len, ORLOCOMM_CHANNEL *from);
ORLO_EXPORT int HandleBandMsg(const void *msg, int len, ORLOCOMM_CHANNEL *from);
ORLO_EXPORT int HandleUBindMsg(const void *msg, int len, ORLOCOMM_CHANNEL *from);
ORLO_EXPORT int HandleUBondMsg(const void *msg, int len, ORLOCOMM_CHANNEL *from);
ORLO_EXPORT int HandleUBandMsg(const void *msg, int len, ORLOCOMM_CHANNEL *from);
ORLO_EXPORT int HandlePingMsg(const void *msg, int len, ORLOCOMM_CHANNEL *from);
ORLO_EXPORT int HandlePongMsg(const void *msg, int len, ORLOCOMM_CHANNEL *from);
ORLO_EXPORT int HandleAppBroken(const void *msg, int len, ORLOCOMM_CHANNEL *from);
ORLO_EXPORT int HandleRejectMsg(const void *msg, int len, ORLOCOMM_CHANNEL *from);
ORLO_EXPORT int IssueRejectMsg(const void *msg, int len, ORLOCOMM_CHANNEL *from);
/* Checks the version of one received message and runs its handler.  1 when the engine
 * is asked to stop, 0 otherwise. */
ORLO_EXPORT int EngDispatchMessage(const void *msg, int len, ORLOCOMM_CHANNEL *from);

/* ---- The public face (orlocomm) ---- */
ORLO_EXPORT PORLOCOMM CreateOrloComm(const char *name);
ORLO_EXPORT int InitOrloComm(PORLOCOMM handle, const char *name);
ORLO_EXPORT int DestroyOrloComm(PORLOCOMM handle);
ORLO_EXPORT int OrloCommConnect(PORLOCOMM handle, const char *host, const char *service);
ORLO_EXPORT int OrloCommDisconnect(PORLOCOMM handle, int index);
ORLO_EXPORT int OrloCommIsConnect(PORLOCOMM handle, const char *host, const char *service);
ORLO_EXPORT int CommSendMessage(PORLOCOMM handle, int index, const void *data, int len);
ORLO_EXPORT int CommUSendMessage(PORLOCOMM handle, const char *to_uuid, const void *data, int len);
ORLO_EXPORT int CommRecvMessage(PORLOCOMM handle, void *buf, int size);
ORLO_EXPORT ORLOCOMM_ENG *CreateEngComm(void);
ORLO_EXPORT void ReleaseEngComm(ORLOCOMM_ENG *eng);
ORLO_EXPORT int StartEngCommSockServer(ORLOCOMM_ENG *eng);
ORLO_EXPORT int StopEngCommSockServer(ORLOCOMM_ENG *eng);
ORLO_EXPORT int StartEngCommPipeServer(ORLOCOMM_ENG *eng);
ORLO_EXPORT int StopEngCommPipeServer(ORLOCOMM_ENG *eng);
ORLO_EXPORT int InitOrloCommEvlp(PORLOCOMM_EVLP holder);
ORLO_EXPORT PORLOCOMM_EVLP CreateOrloCommEvlp(void);
ORLO_EXPORT void FreeOrloCommEvlpData(PORLOCOMM_EVLP e);
ORLO_EXPORT void ReleaseOrloCommEvlp(PORLOCOMM_EVLP e);
ORLO_EXPORT int CommRecvEvlp(PORLOCOMM handle, PORLOCOMM_EVLP e);
/* As CommRecvEvlp, waiting at most timeout_ms; 0 when nothing came (the envelope is then
 * left as it was). */
ORLO_EXPORT int CommRecvEvlpTimed(PORLOCOMM handle, PORLOCOMM_EVLP e, int timeout_ms);
ORLO_EXPORT void *CommGetEvlpData(PORLOCOMM_EVLP e);
ORLO_EXPORT int CommRetEvlp(PORLOCOMM handle, PORLOCOMM_EVLP e, const void *data, int len);
ORLO_EXPORT int CommGetEvlpDataLen(PORLOCOMM_EVLP e);
ORLO_EXPORT int CommGetEvlpFD(PORLOCOMM handle, PORLOCOMM_EVLP e);
ORLO_EXPORT int CreateLocalOrloCommCountFile(void);
ORLO_EXPORT const char *GetGlobalHostName(void);
ORLO_EXPORT const char *GetGlobalHostIP(void);
ORLO_EXPORT int IsServiceAlive(const char *pid_file);
ORLO_EXPORT int CreatePidFile(const char *pid_file);
ORLO_EXPORT int SetSignalAction(void (*handler)(int));
ORLO_EXPORT int FreeSignalAction(void);

/* Base channel operations (the nested channel of a pipe or socket channel). */
ORLO_EXPORT ORLOCOMM_CHANNEL *orlocomm_base_construct(const char *name, int owner, int end,
                                                      const ORLOCOMM_TRANSPORT *transport);
ORLO_EXPORT void orlocomm_base_destruct(ORLOCOMM_CHANNEL *ch);
ORLO_EXPORT int orlocomm_base_send_msg(ORLOCOMM_CHANNEL *ch, const void *msg, int len);
ORLO_EXPORT int orlocomm_base_recv_msg(ORLOCOMM_CHANNEL *ch, void *buf, int size);
ORLO_EXPORT int orlocomm_base_external_request(ORLOCOMM_CHANNEL *ch, const void *msg, int len, void *reply,
                                               int size);
ORLO_EXPORT int orlocomm_base_external_response(ORLOCOMM_CHANNEL *ch, const void *msg, int len);

ORLO_EXTERN_C_END

#endif
