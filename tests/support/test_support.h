#pragma once

#include <gtest/gtest.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdio>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <string>

#include "core/message.h"

/// Helpers shared by the test programs: running a built program and a fresh working directory.
namespace oxtest {

/// What a program run printed (stdout and stderr together) and its exit status.
struct RunResult {
    int status = -1;
    std::string output;
};

/// Runs a program of the build with a shell-quoted argument string.
inline RunResult runProgram(const std::string &program, const std::string &args) {
    RunResult r;
    const std::string cmd = program + " " + args + " 2>&1";
    FILE *p = popen(cmd.c_str(), "r");
    if (!p) return r;
    char buf[4096];
    size_t n;
    while ((n = fread(buf, 1, sizeof buf, p)) > 0) r.output.append(buf, n);
    const int st = pclose(p);
    r.status = WIFEXITED(st) ? WEXITSTATUS(st) : -1;
    return r;
}

/// What the message function prints to the console while f runs. Message types in extraTypes
/// (debug, verbose) are switched on for the call and the default filters restored afterwards.
template <typename F>
std::string captureOutput(F &&f, uint32_t extraTypes = 0) {
    if (extraTypes != 0) ox::setTypeEnabled(extraTypes, true);
    ::testing::internal::CaptureStdout();
    f();
    std::string out = ::testing::internal::GetCapturedStdout();
    if (extraTypes != 0) ox::resetMessageFilters();
    return out;
}

/// The whole content of a file ("" when it cannot be read).
inline std::string readFile(const std::string &path) {
    std::ifstream in(path, std::ios::binary);
    return std::string(std::istreambuf_iterator<char>(in), {});
}

/// Replaces a file's content with text.
inline void writeFile(const std::string &path, const std::string &text) {
    std::ofstream(path, std::ios::binary) << text;
}

/// How often `what` occurs in text (overlapping occurrences count).
inline int countOf(const std::string &text, const std::string &what) {
    int n = 0;
    for (size_t p = text.find(what); p != std::string::npos; p = text.find(what, p + 1)) ++n;
    return n;
}

/// Whether text contains part.
inline bool contains(const std::string &text, const std::string &part) {
    return text.find(part) != std::string::npos;
}

/// The <ObjectToWorld> element of a scene file for a row-vector matrix (translation last).
inline std::string objectToWorldXml(const float (&rows)[4][4]) {
    std::string s = "<ObjectToWorld>";
    for (const auto &row : rows) {
        s += "<r>";
        for (float v : row) s += "<c>" + std::to_string(v) + "</c>";
        s += "</r>";
    }
    return s + "</ObjectToWorld>";
}

/// The <ObjectToWorld> element of a translation.
inline std::string translationXml(float x, float y, float z) {
    const float m[4][4] = {{1, 0, 0, 0}, {0, 1, 0, 0}, {0, 0, 1, 0}, {x, y, z, 1}};
    return objectToWorldXml(m);
}

/// A fixture whose tests each run in a fresh temporary directory with the message filters of a
/// new process; the old directory is restored and the temporary one removed afterwards.
class TempDirTest : public ::testing::Test {
protected:
    explicit TempDirTest(const char *prefix) : prefix_(prefix) {}
    void SetUp() override {
        old_ = std::filesystem::current_path();
        dir_ = std::filesystem::temp_directory_path() /
               (prefix_ + std::to_string(::getpid()) + "_" +
                ::testing::UnitTest::GetInstance()->current_test_info()->name());
        std::filesystem::remove_all(dir_);
        std::filesystem::create_directories(dir_);
        std::filesystem::current_path(dir_);
        ox::resetMessageFilters();
    }
    void TearDown() override {
        ox::resetMessageFilters();
        std::filesystem::current_path(old_);
        std::filesystem::remove_all(dir_);
    }
    std::string prefix_;
    std::filesystem::path old_, dir_;
};

}  // namespace oxtest
