// orloiscsi errstr CODE...: decodes result codes, one "CODE<TAB>message" line each.
#include <cstdio>

#include "base/iscsi_base_internal.h"
#include "cli.h"

namespace cli {

namespace {

int RunErrstr(const std::vector<std::string> &args) {
    std::vector<uint32_t> codes;
    for (const std::string &a : args) {
        uint32_t code = 0;
        if (!ParseCode(a, &code)) return UsageError("'" + a + "' is not a result code");
        codes.push_back(code);
    }
    if (Ctx().json) {
        Json doc = Json::Array();
        for (uint32_t code : codes)
            doc.Push(Json::Object()
                         .SetUint("code", code)
                         .SetInt("signed", static_cast<int32_t>(code))
                         .SetStr("message", ORLOiSCSIErrStr(code)));
        PrintJson(doc);
        return 0;
    }
    for (size_t i = 0; i < codes.size(); ++i) printf("%s\t%s\n", args[i].c_str(), ORLOiSCSIErrStr(codes[i]));
    return 0;
}

}  // namespace

void RegisterErrstr(CLI::App *root) {
    static std::vector<std::string> codes;
    CLI::App *a = AddAction(root, "errstr", "decode result codes into their messages (negative errno values too)",
                            [] { return RunErrstr(codes); }, kLeavesRoot);
    AddPositionals(a, "CODE", &codes, "a result code: decimal, negative (a negated errno value) or 0x hexadecimal");
}

}  // namespace cli
