// Route indexes: the small numbers, private to one application, that name a pair (this
// application, peer application).
#include <cstdlib>

#include "comm/orlocomm_internal.h"

// Makes a rule of app pointing at peer_app with the smallest index 0..255 that no rule of
// app uses yet.  The caller holds app's queue mutex and links the rule in.
extern "C" ORLO_EXPORT ORLOCOMM_RULE *CreateRuleItem(ORLOCOMM_APP *app, ORLOCOMM_APP *peer_app) {
    if (app == nullptr || peer_app == nullptr) {
        COMM_ERR("Invalid parameter");
        return nullptr;
    }
    bool used[ORLOCOMM_MAX_ROUTE_RULES] = {false};
    for (ORLOCOMM_LINK *l = app->rules.next; l != &app->rules; l = l->next) {
        int idx = COMM_ENTRY(l, ORLOCOMM_RULE, link)->index;
        if (idx >= 0 && idx < ORLOCOMM_MAX_ROUTE_RULES) used[idx] = true;
    }
    int index = -1;
    for (int i = 0; i < ORLOCOMM_MAX_ROUTE_RULES && index < 0; ++i)
        if (!used[i]) index = i;
    if (index < 0) {
        COMM_ERR("Fail to create routing index");
        return nullptr;
    }
    auto *rule = static_cast<ORLOCOMM_RULE *>(calloc(1, sizeof(ORLOCOMM_RULE)));
    if (rule == nullptr) {
        COMM_ERR("Out of memory");
        return nullptr;
    }
    orlocomm::LinkInit(&rule->link);
    rule->owner = app;
    rule->peer = peer_app;
    rule->index = index;
    return rule;
}

// The route kind of a routed message, from its source and destination hosts.
extern "C" ORLO_EXPORT int GetMsgRouteKind(const void *msg) {
    if (msg == nullptr) return -1;
    const auto *r = static_cast<const ORLOCOMM_ROUTE_MSG *>(msg);
    char src[ORLOCOMM_NAME_SIZE], dst[ORLOCOMM_NAME_SIZE];
    orlocomm::CopyName(src, r->src_host);
    orlocomm::CopyName(dst, r->dst_host);
    return GetRouteKind(r->src_ip, src, r->dst_ip, dst);
}
