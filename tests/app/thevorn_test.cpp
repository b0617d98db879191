// Runs the built program the way a user does and checks exit codes, console text and files.
#include <gtest/gtest.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <sstream>

namespace fs = std::filesystem;

namespace {

struct Result {
    int exitCode = -1;
    std::string out;
};

std::string quote(const std::string &s) {
    std::string q = "'";
    for (char c : s) q += c == '\'' ? std::string("'\\''") : std::string(1, c);
    return q + "'";
}

class Thevorn : public ::testing::Test {
protected:
    void SetUp() override {
        dir_ = fs::temp_directory_path() /
               ("ox_thevorn_test_" + std::to_string(::getpid()) + "_" +
                ::testing::UnitTest::GetInstance()->current_test_info()->name());
        fs::remove_all(dir_);
        fs::create_directories(dir_);
    }
    void TearDown() override { fs::remove_all(dir_); }

    Result run(const std::vector<std::string> &args, const std::string &env = "") {
        std::string command =
            "cd " + quote(dir_.string()) + " && " + env + " " + quote(OX_BINARY_DIR "/app/thevorn");
        for (const auto &a : args) command += " " + quote(a);
        command += " > console.txt 2>&1";
        const int status = std::system(command.c_str());
        Result r;
        r.exitCode = WIFEXITED(status) ? WEXITSTATUS(status) : -1;
        std::ifstream in(dir_ / "console.txt");
        std::stringstream s;
        s << in.rdbuf();
        r.out = s.str();
        fs::remove(dir_ / "console.txt");
        return r;
    }
    bool has(const Result &r, const std::string &text) const {
        return r.out.find(text) != std::string::npos;
    }
    fs::path dir_;
};

constexpr const char *kBanner = "[INFO]     Zarnex Vorn (Rev: 179347)\n";
constexpr const char *kUsageStart =
    "[ERROR]    thevorn <scene.xml> -o <outfile> -x <configuration.xml>\n";

TEST_F(Thevorn, EverySyntaxMessageEndsWithTheUsage) {
    const auto listFails = [](const std::string &what) {  // the reader's reason, then ours
        return "[ERROR]    Error opening file l.xml in xmlsource\n"
               "Unable to load input file list from file: l.xml\n"
               "Unable to build list of " +
               what + ".";
    };
    const std::vector<std::pair<std::vector<std::string>, std::string>> cases = {
        {{},
         "Syntax error, the chosen command requires a scene but no input filename was "
         "specified."},
        {{"s.xml", "-x"}, "Syntax error, -x needs argument."},
        {{"s.xml", "-o", "a", "-o", "b"}, "Syntax error, more than one output file specified"},
        {{"s.xml", "-o"}, "Syntax error, -o needs argument."},
        {{"s.xml", "-od", "a", "-od", "b"},
         "Syntax error, more than one output directory specified"},
        {{"s.xml", "-od"}, "Syntax error, -od needs argument."},
        {{"s.xml", "-od", ""}, "Syntax error, -od needs argument."},
        {{"-spl", "0"}, "Syntax error, -spl needs <num> argument."},
        {{"-spl"}, "Syntax error, -spl needs <num> argument."},
        {{"s.xml", "-pat"}, "Syntax error, -pat needs argument."},
        {{"s.xml", "-p"}, "Syntax error, -p needs argument."},
        {{"s.xml", "-i"}, "Syntax error, -i needs argument."},
        {{"s.xml", "-pi"}, "Syntax error, -pi needs argument."},
        {{"s.xml", "-ri"}, "Syntax error, -ri needs argument."},
        {{"s.xml", "-rt"}, "Syntax error, -rt needs argument."},
        {{"s.xml", "-bake"}, "Syntax error, unknown option -bake"},
        {{"-c", "x.xml", "-xs"}, "Syntax error, too many actions specified."},
        {{"s.xml", "-t", "-j"}, "Syntax error, too many file formats specified."},
        {{"s.xml", "-rm"}, "Syntax error, -rm needs at least one image to merge."},
        {{"s.xml", "-im", "target"}, "Syntax error, -im needs at least one image to merge."},
        {{"-pmbo", "0.5"}, "Syntax error, -pmbo needs at least one pointcloud to merge."},
        {{"s.xml", "-i", "l.xml"}, listFails("input files")},
        {{"-pm", "-pi", "l.xml"}, listFails("point cloud input files")},
        {{"s.xml", "-ri", "l.xml"}, listFails("image merge input files")},
    };
    for (const auto &[args, line] : cases) {
        const Result r = run(args);
        EXPECT_EQ(r.exitCode, 2) << line;
        EXPECT_EQ(r.out.rfind(kBanner + line + "\n" + kUsageStart, 0), 0u) << r.out;
        EXPECT_TRUE(has(r, "    More than one -ri parameter is supported.\n\n")) << line;
    }
    // Two configuration files: the usage without a line of its own.
    const Result r = run({"s.xml", "-x", "a.xml", "b.xml"});
    EXPECT_EQ(r.exitCode, 2);
    EXPECT_EQ(r.out.rfind(std::string(kBanner) + kUsageStart, 0), 0u) << r.out;
    EXPECT_TRUE(fs::is_empty(dir_));  // nothing was created
}

TEST_F(Thevorn, WritesDefaultsAndSchemaAsked) {
    std::ofstream(dir_ / "config.xml") << "old";
    Result r = run({"-c"});
    EXPECT_EQ(r.exitCode, 0);
    EXPECT_EQ(r.out, std::string(kBanner) +
                         "[PROGRESS] Writing a default xml file (config.xml)\n"
                         "[PROGRESS] Done!\n");
    std::ifstream written(dir_ / "config.xml");
    std::string first;
    std::getline(written, first);
    EXPECT_EQ(first, "<?xml version=\"1.0\" encoding=\"ISO-8859-1\"?>");  // replaced, not kept
    r = run({"-xs", "-q"});
    EXPECT_EQ(r.exitCode, 0);
    EXPECT_TRUE(has(r, "[PROGRESS] Writing a default xml schema file (config.xsd)\n"));
    EXPECT_TRUE(fs::is_regular_file(dir_ / "config.xsd"));
    // A directory in the way: the platform's error code (EISDIR = 21) is the exit code.
    fs::remove(dir_ / "config.xml");
    fs::create_directory(dir_ / "config.xml");
    r = run({"-c"});
    EXPECT_EQ(r.exitCode, 21) << r.out;
    EXPECT_TRUE(has(r, "[ERROR]    Unable to write config.xml: "));
    for (const auto &e : fs::directory_iterator(dir_))  // no temporary file is left behind
        EXPECT_EQ(e.path().filename().string().find(".tmp"), std::string::npos) << e.path();
}

TEST_F(Thevorn, LinesThatLetTheRunGoOnAndTheOutputTree) {
    const Result r = run({"scene.xml", "-rt", "abc", "-p", "x", "-od", "out", "-d"});
    EXPECT_EQ(r.exitCode, 4) << r.out;  // no driver for the camera render yet
    EXPECT_TRUE(has(r, "Syntax error, abc is not a valid input to -rt\n"));
    EXPECT_TRUE(has(r, "Syntax error, x is not a valid priority (h, l or n).\n"));
    EXPECT_FALSE(has(r, "The render thread count"));  // a bad -rt leaves the automatic count
    EXPECT_TRUE(has(r, "[INFO]     Detected "));
    EXPECT_TRUE(has(r, "[ERROR]    The camera render (-r) is not available"));
    EXPECT_FALSE(has(r, "[ERROR]    thevorn <scene.xml>"));
    for (const char *sub :
         {"out", "out/GI", "out/GI/fgMaps", "out/GI/ptMaps", "out/GI/photonMaps", "out/GI/occMaps"})
        EXPECT_TRUE(fs::is_directory(dir_ / sub)) << sub;
}

TEST_F(Thevorn, ThreadCountsAndStatuses) {
    Result r = run({"scene.xml", "-b", "-rt", "0", "-od", "deep/er/out/"});
    EXPECT_EQ(r.exitCode, 4);
    EXPECT_TRUE(has(r, "[WARNING]  The render thread count 0 is outside 1 to 1024, using 1\n"));
    EXPECT_TRUE(has(r, "The texture bake (-b) is not available"));
    EXPECT_TRUE(fs::is_directory(dir_ / "deep/er/out/GI/occMaps"));

    std::ofstream(dir_ / "broken.xml") << "<OXConfig><FrameSettings></OXConfig>";
    for (const std::string file : {"missing.xml", "broken.xml", "."}) {
        r = run({"scene.xml", "-x", file});
        EXPECT_EQ(r.exitCode, 3) << file;  // status 0x20000003
        EXPECT_TRUE(has(r, "[ERROR]    Unable to load settings from file " + file + "\n")) << r.out;
    }
    EXPECT_FALSE(fs::exists(dir_ / "GI"));  // nothing prepared for a run that cannot start

    // An output directory that cannot be created ends the run with the platform's code.
    std::ofstream(dir_ / "file") << "x";
    r = run({"scene.xml", "-od", "file/sub"});
    EXPECT_EQ(r.exitCode, 20);  // ENOTDIR
    EXPECT_TRUE(has(r, "[ERROR]    Unable to create the output directory file/sub/"));

    r = run({"-pm", "a.pc", "-p", "l"});
    EXPECT_EQ(r.exitCode, 4);
    EXPECT_TRUE(has(r, "The point cloud merge (-pm) is not available"));
}

}  // namespace
