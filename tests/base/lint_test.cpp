// Keeps every path-taking and process-starting system call inside the OS seam: no
// library or tool source outside platform/ may call them directly.
#include <gtest/gtest.h>

#include <dirent.h>
#include <sys/stat.h>

#include <fstream>
#include <regex>
#include <string>
#include <vector>

namespace {

void Collect(const std::string &dir, std::vector<std::string> *out) {
    DIR *d = opendir(dir.c_str());
    if (d == nullptr) return;
    while (struct dirent *e = readdir(d)) {
        std::string name = e->d_name;
        if (name == "." || name == "..") continue;
        std::string path = dir + "/" + name;
        struct stat st;
        if (lstat(path.c_str(), &st) != 0) continue;
        if (S_ISDIR(st.st_mode)) {
            Collect(path, out);
        } else if (std::regex_search(name, std::regex("\\.(c|cc|cpp|h|hpp)$"))) {
            out->push_back(path);
        }
    }
    closedir(d);
}

TEST(Lint, RawSystemCallsStayInsideTheOsSeam) {
    const std::regex raw(
        "(^|[^\\w:.>])(::)?(open|open64|openat|fopen|freopen|mkdir|mkdirat|rmdir|unlink|unlinkat|rename|"
        "renameat|symlink|symlinkat|readlink|stat|lstat|access|faccessat|opendir|mkstemp|mkdtemp|mkfifo|"
        "statvfs|statfs|truncate|chmod|chown|lchown|realpath|execv|execvp|execve|execl|execlp|popen|"
        "system|posix_spawn|posix_spawnp)\\s*\\(");
    std::vector<std::string> files;
    for (const char *dir : {"base", "lun", "target", "service", "ep", "snapshot", "replication", "comm",
                            "lunbkp", "tools", "include"})
        Collect(std::string(ORLO_SOURCE_DIR) + "/" + dir, &files);
    ASSERT_FALSE(files.empty());
    std::vector<std::string> offenders;
    for (const std::string &f : files) {
        std::ifstream in(f);
        std::string line;
        int n = 0;
        while (std::getline(in, line)) {
            ++n;
            std::string code = line.substr(0, line.find("//"));
            code = std::regex_replace(code, std::regex("/\\*.*?\\*/"), " ");
            size_t first = code.find_first_not_of(" \t");
            if (first != std::string::npos && (code[first] == '*' || code.compare(first, 2, "/*") == 0)) continue;
            // Strip string literals: log texts name the calls they report.
            code = std::regex_replace(code, std::regex("\"([^\"\\\\]|\\\\.)*\""), "\"\"");
            if (std::regex_search(code, raw)) offenders.push_back(f + ":" + std::to_string(n) + ": " + line);
        }
    }
    std::string report;
    for (const std::string &o : offenders) report += o + "\n";
    EXPECT_TRUE(offenders.empty()) << report;
}

}  // namespace
