// orloiscsi isns: the iSNS client's settings and what the server holds (status), turning
// it on and off, pointing it at a server, and renewing the registrations (refresh).
#include <cstdio>
#include <string>

#include "base/iscsi_base_internal.h"
#include "cli.h"
#include "orloiscsi_target.h"

namespace cli {

namespace {

// "answering, 2 targets registered", or why the server could not be asked.
std::string ServerWords(const ORLOiSCSIiSNSStatus &st) {
    if (!st.enabled) return "not asked (iSNS is off)";
    if (st.error != 0) return "unusable: " + std::to_string(st.error) + " " + ORLOiSCSIErrStr(st.error);
    return "answering, " + std::to_string(st.registered) + (st.registered == 1 ? " target" : " targets") +
           " registered";
}

int RunStatus() {
    ORLOiSCSIiSNSStatus st;
    uint32_t ret = ORLOiSCSIiSNSStatusGet(&st);
    if (ret != 0) return Fail(ret);
    if (Ctx().json) {
        PrintJson(Json::Object()
                      .SetBool("enabled", st.enabled)
                      .SetStr("server", st.server)
                      .SetInt("port", st.port)
                      .SetStr("entity", st.entity)
                      .SetInt("timeout", st.timeout)
                      .SetInt("registration_period", st.registration_period)
                      .SetBool("reachable", st.reachable)
                      .SetInt("registered", st.registered)
                      .SetUint("error", st.error));
        return 0;
    }
    printf("iSNS:     %s\n", st.enabled ? "on" : "off");
    printf("server:   %s\n", st.server[0] != '\0' ? st.server : "(not set)");
    if (st.enabled && st.error == 0) {
        printf("entity:   %s\n", st.entity);
        printf("timeout:  %d s\n", st.timeout);
        printf("period:   %d s asked\n", st.registration_period);
    }
    printf("state:    %s\n", ServerWords(st).c_str());
    return 0;
}

int RunStep(uint32_t (*op)(void), const char *done) {
    uint32_t ret = op();
    if (ret != 0) return Fail(ret);
    printf("%s\n", done);
    return 0;
}

}  // namespace

void RegisterIsns(CLI::App *root) {
    static std::string server;
    CLI::App *obj = AddObject(root, "isns", "announcing the running targets to an iSNS server");
    AddAction(obj, "status", "the settings of isns.conf and what the server holds", RunStatus);
    AddAction(obj, "enable", "turn iSNS on and register every running target with the server",
              [] { return RunStep(ORLOiSCSIiSNSEnable, "iSNS on: every running target registered"); });
    AddAction(obj, "disable", "withdraw this appliance from the server and turn iSNS off",
              [] { return RunStep(ORLOiSCSIiSNSDisable, "iSNS off"); });
    CLI::App *act = AddAction(obj, "server",
                              "use another iSNS server (a name, a.b.c.d or [v6], with :port unless 3205); with "
                              "iSNS on, withdraw from the old one and register with the new one",
                              [] {
                                  uint32_t ret = ORLOiSCSIiSNSServerSet(server.c_str());
                                  if (ret != 0) return Fail(ret);
                                  printf("iSNS server: %s\n", server.c_str());
                                  return 0;
                              });
    AddPositional(act, "ADDR", &server, "the server's address");
    AddAction(obj, "refresh",
              "register every running target again, renewing the registrations (run it more often than half "
              "the server's registration period)",
              [] {
                  if (!ORLOiSCSIiSNSIsEnabled()) {
                      printf("iSNS is off: nothing to renew\n");
                      return 0;
                  }
                  return RunStep(ORLOiSCSIiSNSRefresh, "registrations renewed");
              });
}

}  // namespace cli
