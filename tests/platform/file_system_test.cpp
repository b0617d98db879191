#include "platform/file_system.h"

#include <gtest/gtest.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <filesystem>
#include <fstream>

#include "core/message.h"
#include "platform/system.h"
#include "tests/support/test_support.h"

namespace fs = std::filesystem;

namespace {

class FileSystemTest : public oxtest::TempDirTest {
protected:
    FileSystemTest() : TempDirTest("ox_fs_test_") {}
    std::string path(const std::string &name) const { return (dir_ / name).string(); }
    std::vector<std::string> entries() const {
        std::vector<std::string> out;
        for (const auto &e : fs::directory_iterator(dir_)) out.push_back(e.path().filename());
        return out;
    }
};

using ox::FileSystemUtilities;

TEST_F(FileSystemTest, CreatesEveryMissingLevel) {
    EXPECT_TRUE(FileSystemUtilities::createDirectories(path("a/b/c/")));
    EXPECT_TRUE(fs::is_directory(path("a/b/c")));
    EXPECT_TRUE(FileSystemUtilities::createDirectories(path("a/b/c")));  // already there
    EXPECT_TRUE(FileSystemUtilities::createDirectories(path("a//d/./e")));
    EXPECT_TRUE(fs::is_directory(path("a/d/e")));
    std::ofstream(path("file")) << "x";
    EXPECT_FALSE(FileSystemUtilities::createDirectories(path("file/sub")));
    EXPECT_EQ(FileSystemUtilities::lastError(), ENOTDIR);
    EXPECT_FALSE(FileSystemUtilities::createDirectories(""));
}

TEST_F(FileSystemTest, ReadsOnlyReadableFilesAndOpensInEveryMode) {
    std::ofstream(path("there")) << "x";
    EXPECT_TRUE(FileSystemUtilities::canRead(path("there")));
    EXPECT_FALSE(FileSystemUtilities::canRead(path("missing")));
    EXPECT_EQ(FileSystemUtilities::lastError(), ENOENT);
    EXPECT_FALSE(FileSystemUtilities::canRead(dir_.string()));
    EXPECT_EQ(FileSystemUtilities::lastError(), EISDIR);
    EXPECT_FALSE(FileSystemUtilities::canRead(""));

    std::string text;
    EXPECT_TRUE(FileSystemUtilities::readFile(path("there"), text));
    EXPECT_EQ(text, "x");
    std::ofstream(path("big")) << std::string(100, 'y');
    EXPECT_FALSE(FileSystemUtilities::readFile(path("big"), text, 99));
    EXPECT_EQ(FileSystemUtilities::lastError(), EFBIG);
    EXPECT_TRUE(text.empty());

    for (auto [mode, line] :
         {std::pair{ox::FileAccess::kWrite, "one\n"}, {ox::FileAccess::kAppend, "two\n"}}) {
        auto f = FileSystemUtilities::open(path("log"), mode, false);
        ASSERT_TRUE(f);
        std::fputs(line, f.get());
    }
    EXPECT_EQ(oxtest::readFile(path("log")), "one\ntwo\n");
    EXPECT_FALSE(FileSystemUtilities::open(path("none/x"), ox::FileAccess::kRead));
    EXPECT_EQ(FileSystemUtilities::lastError(), ENOENT);
}

TEST_F(FileSystemTest, AtomicWritesReplaceWholeOrNothing) {
    const std::string target = path("out.txt");
    std::ofstream(target) << "old";
    EXPECT_FALSE(ox::writeFileAtomically(target, [](std::FILE *f) {
        std::fputs("half", f);
        return false;
    }));
    EXPECT_EQ(oxtest::readFile(target), "old");
    EXPECT_EQ(entries(), std::vector<std::string>{"out.txt"});  // no temporary left behind

    EXPECT_TRUE(ox::writeFileAtomically(target, std::string("new contents")));
    EXPECT_EQ(oxtest::readFile(target), "new contents");
    EXPECT_EQ(entries(), std::vector<std::string>{"out.txt"});

    {
        // Writers that want a name write to the temporary name, which appears only on commit.
        ox::AtomicFile file(path("image.tga"));
        const std::string temp = file.tempPath();
        ASSERT_FALSE(temp.empty());
        EXPECT_EQ(ox::FileSystemUtilities::directoryOf(temp), dir_.string() + "/");
        std::ofstream(temp) << "pixels";
        EXPECT_FALSE(fs::exists(path("image.tga")));
        EXPECT_TRUE(file.commit());
    }
    EXPECT_EQ(oxtest::readFile(path("image.tga")), "pixels");
    {
        ox::AtomicFile abandoned(path("never.bin"));
        std::fputs("data", abandoned.file());
    }
    EXPECT_FALSE(fs::exists(path("never.bin")));
    EXPECT_EQ(entries().size(), 2u);

    EXPECT_FALSE(ox::writeFileAtomically(path("nodir/x.txt"), std::string("x")));
    EXPECT_EQ(FileSystemUtilities::lastError(), ENOENT);
    EXPECT_FALSE(ox::writeFileAtomically(dir_.string() + "/", std::string("x")));
}

TEST(System, ProcessorsPriorityAndDenormals) {
    EXPECT_GE(ox::processorCount(), 1);
    // Priority changes stick to the process, so they are tried in a child.
    const pid_t child = ::fork();
    ASSERT_GE(child, 0);
    if (child == 0) {
        ox::setTypeEnabled(ox::kMsgWarning, false);
        // A process already below nice 10 cannot come back up without privileges.
        if (ox::processNiceValue() > 10) ::_exit(0);
        const bool low = ox::setProcessPriority(ox::kPriorityLow);
        const int lowNice = ox::processNiceValue();
        ox::setProcessPriority(ox::kPriorityHigh);  // may be refused: only a warning
        const bool unknown = ox::setProcessPriority(7);
        ::_exit(low && lowNice >= 10 && !unknown ? 0 : 1);
    }
    int status = 0;
    ASSERT_EQ(::waitpid(child, &status, 0), child);
    EXPECT_TRUE(WIFEXITED(status));
    EXPECT_EQ(WEXITSTATUS(status), 0);

    ox::setFlushDenormalsToZero();
#if defined(__x86_64__) || defined(__aarch64__)
    EXPECT_TRUE(ox::flushDenormalsToZero());
    volatile float tiny = 1e-38f;
    volatile float smaller = tiny * 1e-3f;
    EXPECT_EQ(smaller, 0.0f);
#endif
}

}  // namespace
