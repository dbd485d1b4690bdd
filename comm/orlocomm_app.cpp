// Application records: a service identifier, the channel its messages leave by, the host
// that adopted it, its route rules, its queues of messages read while it waited for
// something else, and a reference count.  Every search takes a reference (AppPut gives it
// back); AppFree marks an app to be deleted, and the last AppPut of a marked app frees it.
#include <climits>
#include <cstdlib>
#include <cstring>

#include "comm/orlocomm_internal.h"

using orlocomm::LinkAddTail;
using orlocomm::LinkEmpty;
using orlocomm::LinkInit;
using orlocomm::LinkRemove;
using orlocomm::MutexGuard;

namespace {

ORLOCOMM_RULE *RuleOf(ORLOCOMM_LINK *l) { return COMM_ENTRY(l, ORLOCOMM_RULE, link); }

ORLOCOMM_APP *CreateApp(const char *name, int pid, int type, int flags) {
    if (name == nullptr || name[0] == '\0') {
        COMM_ERR("Invalid parameter");
        return nullptr;
    }
    auto *app = static_cast<ORLOCOMM_APP *>(calloc(1, sizeof(ORLOCOMM_APP)));
    if (app == nullptr) {
        COMM_ERR("Out of memory");
        return nullptr;
    }
    orlocomm::CopyName(app->id.service_name, name);
    app->id.owner = pid;
    ServiceIDGenerateUUID(&app->id);
    app->type = type;
    app->comm_flags = flags;
    LinkInit(&app->host_link);
    LinkInit(&app->rules);
    orlocomm::QueueInit(&app->control_queue);
    orlocomm::QueueInit(&app->data_queue);
    pthread_mutex_init(&app->queue_mutex, nullptr);
    pthread_mutex_init(&app->queue_mutex2, nullptr);
    pthread_mutex_init(&app->mutex, nullptr);
    app->ref_count = 1;
    COMM_INFO("Create App %s, pid %d", app->id.service_name, pid);
    return app;
}

// Frees every rule of app (the caller holds its queue mutex).
void FreeRules(ORLOCOMM_APP *app) {
    while (!LinkEmpty(&app->rules)) {
        ORLOCOMM_RULE *r = RuleOf(app->rules.next);
        LinkRemove(&r->link);
        free(r);
    }
    app->rule_count = 0;
}

template <typename Pred>
int RemoveRulesIf(ORLOCOMM_APP *app, Pred pred) {
    MutexGuard g(&app->queue_mutex);
    int removed = 0;
    for (ORLOCOMM_LINK *l = app->rules.next; l != &app->rules;) {
        ORLOCOMM_RULE *r = RuleOf(l);
        l = l->next;
        if (pred(r)) {
            LinkRemove(&r->link);
            free(r);
            --app->rule_count;
            ++removed;
        }
    }
    return removed;
}

ORLOCOMM_RULE *FindRule(ORLOCOMM_APP *app, int index) {
    for (ORLOCOMM_LINK *l = app->rules.next; l != &app->rules; l = l->next)
        if (RuleOf(l)->index == index) return RuleOf(l);
    return nullptr;
}

void DestroyApp(ORLOCOMM_APP *app) {
    {
        MutexGuard g(&app->queue_mutex);
        FreeRules(app);
        orlocomm::QueueFreeAll(&app->control_queue);
        orlocomm::QueueFreeAll(&app->data_queue);
        app->control_count = app->data_count = 0;
    }
    if (app->channel != nullptr) CloseAppChannel(app);
    pthread_mutex_destroy(&app->queue_mutex);
    pthread_mutex_destroy(&app->queue_mutex2);
    pthread_mutex_destroy(&app->mutex);
    free(app);
}

}  // namespace

extern "C" {

ORLO_EXPORT ORLOCOMM_APP *CreateLocalAppServer(const char *name, int pid) {
    return CreateApp(name, pid, ORLOCOMM_APP_LOCAL, 0);
}
ORLO_EXPORT ORLOCOMM_APP *CreateLocalAppClient(const char *name, int pid) {
    return CreateApp(name, pid, ORLOCOMM_APP_LOCAL, orlocomm::kCommFlagClient);
}
ORLO_EXPORT ORLOCOMM_APP *CreateRemoteAppServer(const char *name, int pid) {
    return CreateApp(name, pid, ORLOCOMM_APP_REMOTE, 0);
}
ORLO_EXPORT ORLOCOMM_APP *CreateRemoteAppClient(const char *name, int pid) {
    return CreateApp(name, pid, ORLOCOMM_APP_REMOTE, orlocomm::kCommFlagClient);
}

ORLO_EXPORT int UpdateAppID(ORLOCOMM_APP *app, const ServiceID *id) {
    if (app == nullptr || id == nullptr) {
        COMM_ERR("Invalid parameter");
        return -1;
    }
    MutexGuard g(&app->mutex);
    app->id = *id;
    app->id.service_name[ORLOCOMM_NAME_SIZE - 1] = '\0';
    return ServiceIDGenerateUUID(&app->id);
}

ORLO_EXPORT int BindAppChannel(ORLOCOMM_APP *app, ORLOCOMM_CHANNEL *ch) {
    if (app == nullptr || ch == nullptr) {
        COMM_ERR("Invalid parameter");
        return -1;
    }
    ChannelGet(ch);
    ORLOCOMM_CHANNEL *old = app->channel;
    app->channel = ch;
    if (old != nullptr) ChannelPut(old);
    return 0;
}

ORLO_EXPORT int UnBindAppChannel(ORLOCOMM_APP *app) {
    if (app == nullptr) return -1;
    ORLOCOMM_CHANNEL *ch = app->channel;
    app->channel = nullptr;
    if (ch != nullptr) ChannelFree(ch);
    return 0;
}

ORLO_EXPORT int DetachAppChannel(ORLOCOMM_APP *app) {
    if (app == nullptr) return -1;
    ORLOCOMM_CHANNEL *ch = app->channel;
    app->channel = nullptr;
    if (ch != nullptr) ChannelPut(ch);
    return 0;
}

ORLO_EXPORT int CloseAppChannel(ORLOCOMM_APP *app) {
    if (app == nullptr || app->channel == nullptr) return -1;
    ORLOCOMM_CHANNEL *ch = app->channel;
    // A local app owns its channel; a remote app shares its host's and only lets go of it.
    if (app->type != ORLOCOMM_APP_LOCAL) return DetachAppChannel(app);
    if (ch->desc->kind != 0 && pChannelSet != nullptr) RemoveChannel(pChannelSet, ch);
    app->channel = nullptr;
    ChannelFree(ch);
    return 0;
}

ORLO_EXPORT int AddAppRouteRule(ORLOCOMM_APP *app, ORLOCOMM_APP *peer) {
    if (app == nullptr || peer == nullptr) {
        COMM_ERR("Invalid parameter");
        return -1;
    }
    MutexGuard g(&app->queue_mutex);
    ORLOCOMM_RULE *rule = CreateRuleItem(app, peer);
    if (rule == nullptr) return -1;
    LinkAddTail(&app->rules, &rule->link);
    ++app->rule_count;
    return rule->index;
}

ORLO_EXPORT int RemoveAppRouteRule(ORLOCOMM_APP *app, const ORLOCOMM_APP *peer) {
    if (app == nullptr || peer == nullptr) return -1;
    char uuid[ORLOCOMM_NAME_SIZE];
    memcpy(uuid, peer->id.uuid, sizeof(uuid));
    return RemoveRulesIf(app, [&](ORLOCOMM_RULE *r) { return CompareUUID(r->peer->id.uuid, uuid) == 0; });
}

ORLO_EXPORT int RemoveAppRouteRuleByID(ORLOCOMM_APP *app, const ServiceID *id) {
    if (app == nullptr || id == nullptr) return -1;
    return RemoveRulesIf(app, [&](ORLOCOMM_RULE *r) { return CompareSID(&r->peer->id, id) == 0; });
}

ORLO_EXPORT int RemoveAppRouteRuleByFD(ORLOCOMM_APP *app, int index) {
    if (app == nullptr || index < 0) return -1;
    return RemoveRulesIf(app, [&](ORLOCOMM_RULE *r) { return r->index == index; });
}

ORLO_EXPORT ORLOCOMM_APP *GetFromAppByRule(ORLOCOMM_APP *app, int index) {
    if (app == nullptr) return nullptr;
    MutexGuard g(&app->queue_mutex);
    ORLOCOMM_RULE *r = FindRule(app, index);
    return r == nullptr ? nullptr : r->owner;
}

ORLO_EXPORT ORLOCOMM_APP *GetToAppByRule(ORLOCOMM_APP *app, int index) {
    if (app == nullptr) return nullptr;
    MutexGuard g(&app->queue_mutex);
    ORLOCOMM_RULE *r = FindRule(app, index);
    return r == nullptr ? nullptr : r->peer;
}

ORLO_EXPORT int GetRuleIndexByAppServerUUID(ORLOCOMM_APP *app, const char *peer_uuid) {
    if (app == nullptr || peer_uuid == nullptr) return -1;
    COMM_INFO("################### Search UUID %s", peer_uuid);
    MutexGuard g(&app->queue_mutex);
    int found = -1;
    for (ORLOCOMM_LINK *l = app->rules.next; l != &app->rules; l = l->next) {
        ORLOCOMM_RULE *r = RuleOf(l);
        COMM_INFO("################### Rule [%d] %s -> %s", r->index, r->owner->id.uuid, r->peer->id.uuid);
        if (CompareUUID(r->peer->id.uuid, peer_uuid) == 0) found = r->index;
    }
    return found;
}

ORLO_EXPORT int GetAppRefCount(ORLOCOMM_APP *app) {
    if (app == nullptr) return -1;
    MutexGuard g(&app->mutex);
    return app->ref_count;
}

ORLO_EXPORT void AppGet(ORLOCOMM_APP *app) {
    if (app == nullptr) return;
    MutexGuard g(&app->mutex);
    ++app->ref_count;
}

ORLO_EXPORT void AppPut(ORLOCOMM_APP *app) {
    if (app == nullptr) return;
    ORLOCOMM_HOST *host;
    {
        MutexGuard g(&app->mutex);
        host = app->host;
    }
    bool last = false;
    if (host != nullptr) pthread_mutex_lock(&host->mutex);
    pthread_mutex_lock(&app->mutex);
    --app->ref_count;
    if (app->to_be_deleted)
        COMM_INFO(">>>>>>>>>>>>>>>>> Release %s: ref_count %d, to_be_deleted %d", app->id.uuid, app->ref_count,
                  app->to_be_deleted);
    if (app->ref_count <= 0 && app->to_be_deleted) {
        last = true;
        if (app->host != nullptr && app->host == host) {
            LinkRemove(&app->host_link);
            --host->app_count;
            app->host = nullptr;
        }
    }
    pthread_mutex_unlock(&app->mutex);
    if (host != nullptr) pthread_mutex_unlock(&host->mutex);
    if (!last) return;
    DestroyApp(app);
    COMM_INFO(">>>>>>>>>>>>>>>>> Release Done");
}

ORLO_EXPORT void AppFree(ORLOCOMM_APP *app) {
    if (app == nullptr) return;
    {
        MutexGuard g(&app->mutex);
        app->to_be_deleted = 1;
        COMM_INFO("%s: ref_count %d, to_be_deleted %d", app->id.uuid, app->ref_count, app->to_be_deleted);
    }
    AppPut(app);
}

// Frees the app when the caller's is the one access left, else only gives the access back.
ORLO_EXPORT void AppFreeOnOneAccess(ORLOCOMM_APP *app) {
    if (app == nullptr) return;
    if (GetAppRefCount(app) <= 1)
        AppFree(app);
    else
        AppPut(app);
}

ORLO_EXPORT int ReleaseApp(ORLOCOMM_APP *app, int keep_channel) {
    if (app == nullptr) {
        COMM_ERR("Invalid parameter");
        return -1;
    }
    ORLOCOMM_HOST *host;
    {
        MutexGuard g(&app->mutex);
        host = app->host;
    }
    if (host != nullptr) HostAbandonApp(host, app);
    {
        MutexGuard g(&app->queue_mutex);
        FreeRules(app);
    }
    if (keep_channel)
        DetachAppChannel(app);
    else if (app->channel != nullptr)
        CloseAppChannel(app);
    AppFree(app);
    return 0;
}

// Tells every app that holds a rule to app that it is gone.  Call without mCommMutex held.
ORLO_EXPORT int NotifyAppBrokenToRelatedApp(ORLOCOMM_APP *app) {
    if (app == nullptr) {
        COMM_ERR("Invalid parameter");
        return -1;
    }
    orlocomm::Outbox out;
    {
        MutexGuard g(&mCommMutex);
        orlocomm::EngAppGone(app, &out);
    }
    int n = static_cast<int>(out.Size());
    out.Flush();
    return n;
}

ORLO_EXPORT int EnCryptBrokenAppFD(int fd) {
    if (fd < 0 || fd > (INT_MAX - 4) / 256) return -1;
    return -(256 * fd + 4);
}

ORLO_EXPORT int DeCryptBrokenAppFD(int value) {
    if (value >= 0 || value == INT_MIN) return -1;
    int n = -value;
    if ((n & 0xFF) != 4) return -1;
    return n >> 8;
}

}  // extern "C"
