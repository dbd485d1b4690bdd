// Test fixtures: a fresh sandbox root per test (ORLO_SYSROOT points at it) and a
// capture of the library's log lines.
#ifndef ORLO_TESTS_SUPPORT_SANDBOX_H
#define ORLO_TESTS_SUPPORT_SANDBOX_H

#include <gtest/gtest.h>

#include <mutex>
#include <string>
#include <vector>

namespace orlotest {

// Collects every log line of the library while it lives.
class LogCapture {
  public:
    LogCapture();
    ~LogCapture();
    std::vector<std::string> Lines() const;
    // True when some line contains text.
    bool Contains(const std::string &text) const;
    // The lines joined by newlines, for failure messages.
    std::string Dump() const;
    void Clear();

  private:
    static void Sink(int priority, const char *line, void *ctx);
    mutable std::mutex mu_;
    std::vector<std::string> lines_;
};

// A fresh, empty appliance root for each test: ORLO_SYSROOT points at it, the usual
// top directories exist (tmp, usr/orlo/etc, etc, etc.defaults, config, volume1) and it
// is removed afterwards without crossing into anything mounted inside it.
class SandboxTest : public ::testing::Test {
  protected:
    void SetUp() override;
    void TearDown() override;
    // The real path of a logical one.
    std::string Real(const std::string &logical) const { return root_ + logical; }
    // Writes a whole file (logical path), making parent directories.
    void WriteFile(const std::string &logical, const std::string &content, int mode = 0644) const;
    std::string ReadFile(const std::string &logical) const;
    bool Exists(const std::string &logical) const;
    const std::string &root() const { return root_; }

    std::string root_;
    LogCapture log_;
};

// Makes a temporary directory and returns its path.
std::string MakeTempDir(const char *prefix);
// Removes a tree without following links or crossing mount points.
void RemoveTree(const std::string &path);
// Runs a program (no shell) and returns its exit status, collecting its output.
int RunProgram(const std::vector<std::string> &argv, std::string *out = nullptr,
               std::string *err = nullptr, const std::string &input = std::string());
// Path of a program built in this tree (tools, simulator).
std::string BuiltProgram(const std::string &name);

}  // namespace orlotest

#endif
