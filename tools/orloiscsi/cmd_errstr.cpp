// orloiscsi errstr CODE...: decodes result codes, one "CODE<TAB>message" line each.
#include <cinttypes>
#include <cstdio>

#include "base/iscsi_base_internal.h"
#include "cli.h"

namespace cli {

namespace {

int RunErrstr(const Context &ctx, const Args &args) {
    if (args.empty()) return Usage(kErrstrObject, kErrstrObject.actions[0]);
    std::vector<uint32_t> codes;
    for (const std::string &a : args) {
        uint32_t code = 0;
        if (!ParseCode(a, &code)) {
            fprintf(stderr, "orloiscsi: '%s' is not a result code\n", a.c_str());
            return 2;
        }
        codes.push_back(code);
    }
    if (ctx.json) printf("[");
    for (size_t i = 0; i < codes.size(); ++i) {
        const char *msg = ORLOiSCSIErrStr(codes[i]);
        if (ctx.json)
            printf("%s{\"code\":%" PRIu32 ",\"signed\":%d,\"message\":%s}", i ? "," : "", codes[i],
                   static_cast<int32_t>(codes[i]), JsonQuote(msg).c_str());
        else
            printf("%s\t%s\n", args[i].c_str(), msg);
    }
    if (ctx.json) printf("]\n");
    return 0;
}

const Action kActions[] = {
    {"", "CODE...", "print the message of each result code (negative errno values too)", RunErrstr},
    {nullptr, nullptr, nullptr, nullptr},
};

}  // namespace

const Object kErrstrObject = {"errstr", "decode result codes into their messages", kActions};

}  // namespace cli
