// Runs the built program the way a user does and checks exit codes, console text and files.
#include <gtest/gtest.h>

#include <cstdlib>
#include <filesystem>
#include <fstream>

#include "tests/app/app_test_util.h"
#include "tests/support/test_support.h"

namespace fs = std::filesystem;

namespace {

std::string quote(const std::string &s) {
    std::string q = "'";
    for (char c : s) q += c == '\'' ? std::string("'\\''") : std::string(1, c);
    return q + "'";
}

class Thevorn : public oxtest::TempDirTest {
protected:
    Thevorn() : TempDirTest("ox_thevorn_test_") {}
    oxtest::RunResult run(const std::vector<std::string> &args) {
        std::string line;
        for (const auto &a : args) line += " " + quote(a);
        return oxtest::runProgram(OX_BINARY_DIR "/app/thevorn", line);
    }
    bool has(const oxtest::RunResult &r, const std::string &text) const {
        return r.output.find(text) != std::string::npos;
    }
};

constexpr const char *kBanner = "[INFO]     Zarnex Vorn (Rev: 179347)\n";
constexpr const char *kUsageStart =
    "[ERROR]    thevorn <scene.xml> -o <outfile> -x <configuration.xml>\n";

TEST_F(Thevorn, EverySyntaxMessageEndsWithTheUsage) {
    const auto listFails = [](const std::string &what) {  // the reader's reason, then ours
        return "[ERROR]    Error opening file l.xml in xmlsource\n"
               "Unable to load input file list from file: l.xml\nUnable to build list of " +
               what + ".";
    };
    std::vector<std::pair<std::vector<std::string>, std::string>> cases = {
        {{},
         "Syntax error, the chosen command requires a scene but no input filename was "
         "specified."},
        {{"s.xml", "-o", "a", "-o", "b"}, "Syntax error, more than one output file specified"},
        {{"s.xml", "-od", "a", "-od", "b"},
         "Syntax error, more than one output directory specified"},
        {{"s.xml", "-od", ""}, "Syntax error, -od needs argument."},
        {{"-spl", "0"}, "Syntax error, -spl needs <num> argument."},
        {{"-spl"}, "Syntax error, -spl needs <num> argument."},
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
    for (const std::string option : {"-x", "-o", "-od", "-pat", "-p", "-i", "-pi", "-ri", "-rt"})
        cases.push_back({{"s.xml", option}, "Syntax error, " + option + " needs argument."});
    for (const auto &[args, line] : cases) {
        const oxtest::RunResult r = run(args);
        EXPECT_EQ(r.status, 2) << line;
        EXPECT_EQ(r.output.rfind(kBanner + line + "\n" + kUsageStart, 0), 0u) << r.output;
        EXPECT_TRUE(has(r, "    More than one -ri parameter is supported.\n\n")) << line;
    }
    // Two configuration files: the usage without a line of its own.
    const oxtest::RunResult r = run({"s.xml", "-x", "a.xml", "b.xml"});
    EXPECT_EQ(r.status, 2);
    EXPECT_EQ(r.output.rfind(std::string(kBanner) + kUsageStart, 0), 0u) << r.output;
    EXPECT_TRUE(fs::is_empty(dir_));  // nothing was created
}

TEST_F(Thevorn, WritesDefaultsAndSchemaAsked) {
    std::ofstream(dir_ / "config.xml") << "old";
    oxtest::RunResult r = run({"-c"});
    EXPECT_EQ(r.status, 0);
    EXPECT_EQ(r.output, std::string(kBanner) +
                            "[PROGRESS] Writing a default xml file (config.xml)\n"
                            "[PROGRESS] Done!\n");
    std::ifstream written(dir_ / "config.xml");
    std::string first;
    std::getline(written, first);
    EXPECT_EQ(first, "<?xml version=\"1.0\" encoding=\"ISO-8859-1\"?>");  // replaced, not kept
    r = run({"-xs", "-q"});
    EXPECT_EQ(r.status, 0);
    EXPECT_TRUE(has(r, "[PROGRESS] Writing a default xml schema file (config.xsd)\n"));
    // The files agree with each other, and the program reads its own file without a word.
    EXPECT_EQ(std::system("xmllint --noout --schema config.xsd config.xml > lint.txt 2>&1"), 0)
        << apptest::readFile("lint.txt");
    r = run({"s.xml", "-x", "config.xml", "-od", "out"});
    EXPECT_FALSE(has(r, "arning")) << r.output;
    // A directory in the way: the platform's error code (EISDIR = 21) is the exit code.
    fs::remove(dir_ / "config.xml");
    fs::create_directory(dir_ / "config.xml");
    r = run({"-c"});
    EXPECT_EQ(r.status, 21) << r.output;
    EXPECT_TRUE(has(r, "[ERROR]    Unable to write config.xml: "));
    for (const auto &e : fs::directory_iterator(dir_))  // no temporary file is left behind
        EXPECT_EQ(e.path().filename().string().find(".tmp"), std::string::npos) << e.path();
}

TEST_F(Thevorn, LinesThatLetTheRunGoOnTheOutputTreeAndStatuses) {
    oxtest::RunResult r = run({"scene.xml", "-rt", "abc", "-p", "x", "-od", "deep/er/out", "-d"});
    EXPECT_EQ(r.status, 1) << r.output;  // 0x20000000: the scene cannot be read
    EXPECT_TRUE(has(r, "Syntax error, abc is not a valid input to -rt\n"));
    EXPECT_TRUE(has(r, "Syntax error, x is not a valid priority (h, l or n).\n"));
    EXPECT_FALSE(has(r, "The render thread count"));  // a bad -rt leaves the automatic count
    EXPECT_TRUE(has(r, "[ERROR]    Unable to read the scene file scene.xml: scene.xml\n"));
    EXPECT_FALSE(has(r, "[ERROR]    thevorn <scene.xml>"));
    for (const char *sub : {"", "/GI", "/GI/fgMaps", "/GI/ptMaps", "/GI/photonMaps", "/GI/occMaps"})
        EXPECT_TRUE(fs::is_directory(dir_ / ("deep/er/out" + std::string(sub)))) << sub;

    std::ofstream(dir_ / "broken.xml") << "<OXConfig><FrameSettings></OXConfig>";
    for (const std::string file : {"missing.xml", "broken.xml", "."}) {
        r = run({"scene.xml", "-x", file});
        EXPECT_EQ(r.status, 3) << file;  // status 0x20000003
        EXPECT_TRUE(has(r, "[ERROR]    Unable to load settings from file " + file + "\n"))
            << r.output;
    }
    EXPECT_FALSE(fs::exists(dir_ / "GI"));  // nothing prepared for a run that cannot start

    // An output directory that cannot be created ends the run with the platform's code.
    std::ofstream(dir_ / "file") << "x";
    r = run({"scene.xml", "-od", "file/sub"});
    EXPECT_EQ(r.status, 20);  // ENOTDIR
    EXPECT_TRUE(has(r, "[ERROR]    Unable to create the output directory file/sub/"));

    r = run({"-pm", "a.pc", "-p", "l"});  // a merge needs no scene
    EXPECT_EQ(r.status, 4);
    EXPECT_TRUE(has(r, "The point cloud merge (-pm) is not available"));
}

}  // namespace
