// The channel set: every live channel of the process, in four lists by kind (internal,
// external in, external out, process), under one mutex.  Lookups take a reference on the
// channel they return; ChannelPut gives it back.  A channel is destroyed when it has been
// freed (ChannelFree) and its last reference is gone.
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <vector>

#include "comm/orlocomm_internal.h"

using orlocomm::LinkAddTail;
using orlocomm::LinkInit;
using orlocomm::LinkRemove;
using orlocomm::MutexGuard;

extern "C" {
ORLO_EXPORT ORLOCOMM_CHANNEL_SET *pChannelSet = nullptr;
}

namespace {

const char *const kKindNames[] = {"", "Internal", "ExternalIn", "ExternalOut", "Process"};

ORLOCOMM_CHANNEL_DESC *DescOf(ORLOCOMM_LINK *l) { return COMM_ENTRY(l, ORLOCOMM_CHANNEL_DESC, link); }

int AddChannel(ORLOCOMM_CHANNEL_SET *set, ORLOCOMM_CHANNEL *ch, int kind) {
    if (set == nullptr || ch == nullptr || ch->desc == nullptr) {
        COMM_ERR("Invalid parameter");
        return -1;
    }
    MutexGuard g(&set->mutex);
    if (ch->desc->kind != 0) {
        COMM_ERR("%s is already in the %s list", ch->desc->id.service_name, kKindNames[ch->desc->kind]);
        return -1;
    }
    ch->desc->kind = kind;
    LinkAddTail(&set->lists[kind - 1], &ch->desc->link);
    ++set->counts[kind - 1];
    return 0;
}

template <typename Pred>
ORLOCOMM_CHANNEL *FindChannel(ORLOCOMM_CHANNEL_SET *set, int kind, Pred pred) {
    if (set == nullptr) return nullptr;
    MutexGuard g(&set->mutex);
    ORLOCOMM_LINK *head = &set->lists[kind - 1];
    for (ORLOCOMM_LINK *l = head->next; l != head; l = l->next) {
        ORLOCOMM_CHANNEL_DESC *d = DescOf(l);
        if (pred(d)) {
            ChannelGet(d->channel);
            return d->channel;
        }
    }
    return nullptr;
}

ORLOCOMM_CHANNEL *FindByName(ORLOCOMM_CHANNEL_SET *set, int kind, const char *name) {
    if (name == nullptr) return nullptr;
    return FindChannel(set, kind, [&](ORLOCOMM_CHANNEL_DESC *d) {
        return strncmp(d->id.service_name, name, ORLOCOMM_NAME_SIZE - 1) == 0;
    });
}

ORLOCOMM_CHANNEL *FindByUUID(ORLOCOMM_CHANNEL_SET *set, int kind, const char *uuid) {
    if (uuid == nullptr) return nullptr;
    return FindChannel(set, kind, [&](ORLOCOMM_CHANNEL_DESC *d) {
        return strncmp(d->id.uuid, uuid, ORLOCOMM_NAME_SIZE - 1) == 0;
    });
}

int ListChannels(ORLOCOMM_CHANNEL_SET *set, int kind) {
    if (set == nullptr) return -1;
    MutexGuard g(&set->mutex);
    ORLOCOMM_LINK *head = &set->lists[kind - 1];
    for (ORLOCOMM_LINK *l = head->next; l != head; l = l->next) {
        ORLOCOMM_CHANNEL_DESC *d = DescOf(l);
        COMM_INFO("%s channel %s, %p", kKindNames[kind], d->id.service_name, static_cast<void *>(d->channel));
    }
    return set->counts[kind - 1];
}

}  // namespace

extern "C" {

ORLO_EXPORT int InitChannelSet(void) {
    if (pChannelSet != nullptr) {
        COMM_ERR("pChannelSet is NOT empty");
        return -1;
    }
    auto *set = static_cast<ORLOCOMM_CHANNEL_SET *>(calloc(1, sizeof(ORLOCOMM_CHANNEL_SET)));
    if (set == nullptr) {
        COMM_ERR("Out of memory");
        return -1;
    }
    for (ORLOCOMM_LINK &l : set->lists) LinkInit(&l);
    pthread_mutex_init(&set->mutex, nullptr);
    pChannelSet = set;
    return 0;
}

ORLO_EXPORT int DestroyChannelSet(ORLOCOMM_CHANNEL_SET *set) {
    if (set == nullptr) return -1;
    MutexGuard g(&set->mutex);
    return 0;
}

ORLO_EXPORT int AddInternalChannel(ORLOCOMM_CHANNEL_SET *set, ORLOCOMM_CHANNEL *ch) {
    return AddChannel(set, ch, ORLOCOMM_CH_INTERNAL);
}
ORLO_EXPORT int AddExternalInChannel(ORLOCOMM_CHANNEL_SET *set, ORLOCOMM_CHANNEL *ch) {
    return AddChannel(set, ch, ORLOCOMM_CH_EXTERNAL_IN);
}
ORLO_EXPORT int AddExternalOutChannel(ORLOCOMM_CHANNEL_SET *set, ORLOCOMM_CHANNEL *ch) {
    return AddChannel(set, ch, ORLOCOMM_CH_EXTERNAL_OUT);
}
ORLO_EXPORT int AddProcessChannel(ORLOCOMM_CHANNEL_SET *set, ORLOCOMM_CHANNEL *ch) {
    return AddChannel(set, ch, ORLOCOMM_CH_PROCESS);
}

ORLO_EXPORT int RemoveChannel(ORLOCOMM_CHANNEL_SET *set, ORLOCOMM_CHANNEL *ch) {
    if (set == nullptr || ch == nullptr || ch->desc == nullptr) {
        COMM_ERR("Invalid parameter");
        return -1;
    }
    MutexGuard g(&set->mutex);
    int kind = ch->desc->kind;
    if (kind < ORLOCOMM_CH_INTERNAL || kind > ORLOCOMM_CH_PROCESS) {
        COMM_ERR("%s: unknown channel kind %d", ch->desc->id.service_name, kind);
        return -1;
    }
    LinkRemove(&ch->desc->link);
    --set->counts[kind - 1];
    ch->desc->kind = 0;
    return 0;
}

ORLO_EXPORT ORLOCOMM_CHANNEL *GetInternalChannel(ORLOCOMM_CHANNEL_SET *set, const char *name) {
    return FindByName(set, ORLOCOMM_CH_INTERNAL, name);
}
ORLO_EXPORT ORLOCOMM_CHANNEL *GetExternalInChannel(ORLOCOMM_CHANNEL_SET *set, const char *name) {
    return FindByName(set, ORLOCOMM_CH_EXTERNAL_IN, name);
}
ORLO_EXPORT ORLOCOMM_CHANNEL *GetExternalOutChannel(ORLOCOMM_CHANNEL_SET *set, const char *name) {
    return FindByName(set, ORLOCOMM_CH_EXTERNAL_OUT, name);
}
ORLO_EXPORT ORLOCOMM_CHANNEL *GetProcessChannel(ORLOCOMM_CHANNEL_SET *set, const char *name) {
    return FindByName(set, ORLOCOMM_CH_PROCESS, name);
}
ORLO_EXPORT ORLOCOMM_CHANNEL *GetExternalOutChannelByUUID(ORLOCOMM_CHANNEL_SET *set, const char *uuid) {
    return FindByUUID(set, ORLOCOMM_CH_EXTERNAL_OUT, uuid);
}
ORLO_EXPORT ORLOCOMM_CHANNEL *GetProcessChannelByUUID(ORLOCOMM_CHANNEL_SET *set, const char *uuid) {
    return FindByUUID(set, ORLOCOMM_CH_PROCESS, uuid);
}

ORLO_EXPORT int ListExternalInChannel(ORLOCOMM_CHANNEL_SET *set) { return ListChannels(set, ORLOCOMM_CH_EXTERNAL_IN); }
ORLO_EXPORT int ListExternalOutChannel(ORLOCOMM_CHANNEL_SET *set) { return ListChannels(set, ORLOCOMM_CH_EXTERNAL_OUT); }
ORLO_EXPORT int ListInternalChannel(ORLOCOMM_CHANNEL_SET *set) { return ListChannels(set, ORLOCOMM_CH_INTERNAL); }
ORLO_EXPORT int ListProcessChannel(ORLOCOMM_CHANNEL_SET *set) { return ListChannels(set, ORLOCOMM_CH_PROCESS); }

ORLO_EXPORT ORLOCOMM_CHANNEL *GetExternalInChannelByIPV4(uint32_t ip) {
    char name[ORLOCOMM_NAME_SIZE];
    snprintf(name, sizeof(name), "SRqRx_%s", orlocomm::IpText(ip).c_str());
    ORLOCOMM_CHANNEL *ch = GetExternalInChannel(pChannelSet, name);
    if (ch == nullptr) COMM_INFO("%s Not Found", name);
    return ch;
}

ORLO_EXPORT ORLOCOMM_CHANNEL *GetExternalInChannelByHostName(const char *host) {
    uint32_t ip = GetRemoteHostFirstIPV4(host);
    if (ip == 0) return nullptr;
    return GetExternalInChannelByIPV4(ip);
}

ORLO_EXPORT ORLOCOMM_CHANNEL *GetExternalOutChannelByHostName(const char *host) {
    ORLOCOMM_HOST *h = SearchRemoteHostByHostName(host);
    if (h == nullptr) return nullptr;
    uint32_t ips[ORLOCOMM_MAX_HOST_IPS];
    int n;
    {
        MutexGuard g(&h->mutex);
        n = h->ip_count;
        memcpy(ips, h->ips, sizeof(uint32_t) * static_cast<size_t>(n));
    }
    for (int i = 0; i < n; ++i) {
        char name[ORLOCOMM_NAME_SIZE];
        std::string ip = orlocomm::IpText(ips[i]);
        snprintf(name, sizeof(name), "SRqSn_%s", ip.c_str());
        if (ORLOCOMM_CHANNEL *ch = GetExternalOutChannel(pChannelSet, name)) {
            COMM_INFO("^^^^^ Found %s is %s", name, ip.c_str());
            return ch;
        }
    }
    return nullptr;
}

ORLO_EXPORT int ChannelBroadCast(ORLOCOMM_CHANNEL_SET *set, const void *msg, int len) {
    if (set == nullptr || msg == nullptr || len <= 0) {
        COMM_ERR("Invalid parameter");
        return -1;
    }
    std::vector<ORLOCOMM_CHANNEL *> targets;
    {
        MutexGuard g(&set->mutex);
        ORLOCOMM_LINK *head = &set->lists[ORLOCOMM_CH_PROCESS - 1];
        for (ORLOCOMM_LINK *l = head->next; l != head; l = l->next) {
            ChannelGet(DescOf(l)->channel);
            targets.push_back(DescOf(l)->channel);
        }
    }
    for (ORLOCOMM_CHANNEL *ch : targets) {
        COMM_INFO("Broacast opcode [0x%2x], pCh %p, %s", orlocomm::MsgCode(msg), static_cast<void *>(ch),
                  ch->desc->id.service_name);
        orlocomm::ChannelSend(ch, msg, len);
        ChannelPut(ch);
    }
    return static_cast<int>(targets.size());
}

ORLO_EXPORT void ChannelGet(ORLOCOMM_CHANNEL *ch) {
    if (ch == nullptr) return;
    MutexGuard g(&ch->mutex);
    ++ch->ref_count;
}

ORLO_EXPORT void ChannelPut(ORLOCOMM_CHANNEL *ch) {
    if (ch == nullptr) return;
    bool destroy;
    {
        MutexGuard g(&ch->mutex);
        --ch->ref_count;
        destroy = ch->ref_count <= 0 && ch->freed;
    }
    if (destroy) orlocomm::ChannelDestroy(ch);
}

ORLO_EXPORT void ChannelFree(ORLOCOMM_CHANNEL *ch) {
    if (ch == nullptr) return;
    {
        MutexGuard g(&ch->mutex);
        ch->freed = 1;
    }
    ChannelPut(ch);
}

ORLO_EXPORT const char *GetChannelServiceName(const ORLOCOMM_CHANNEL *ch) {
    if (ch == nullptr || ch->desc == nullptr) return nullptr;
    return ch->desc->id.service_name;
}

const ORLOCOMM_TRANSPORT *GetTransportByType(int type) {
    for (const ORLOCOMM_TRANSPORT *const *t = transports; *t != nullptr; ++t)
        if ((*t)->type == type) return *t;
    return nullptr;
}

}  // extern "C"

namespace orlocomm {

void ChannelDestroy(ORLOCOMM_CHANNEL *ch) {
    if (ch->desc != nullptr && ch->desc->kind != 0 && pChannelSet != nullptr) RemoveChannel(pChannelSet, ch);
    if (ch->transport != nullptr && ch->transport->destruct != nullptr)
        ch->transport->destruct(ch);
    else
        orlocomm_base_destruct(ch);
}

int ChannelSend(ORLOCOMM_CHANNEL *ch, const void *msg, int len) {
    if (ch == nullptr || ch->transport == nullptr || ch->transport->send_msg == nullptr) return -1;
    return ch->transport->send_msg(ch, msg, len);
}

}  // namespace orlocomm
