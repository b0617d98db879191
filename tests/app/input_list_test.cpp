// The -i, -pi and -ri list files expand through the configuration reader, in option order.
#include "config/input_list.h"

#include <gtest/gtest.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>

#include "app/command_line.h"

namespace fs = std::filesystem;

namespace {

void writeList(const fs::path &p, const std::vector<std::string> &entries) {
    std::ofstream out(p);
    out << "<?xml version=\"1.0\"?>\n<inputspecification>\n\t<filelist>\n";
    for (const auto &e : entries) out << "\t\t<element>" << e << "</element>\n";
    out << "\t</filelist>\n</inputspecification>\n";
}

}  // namespace

TEST(InputLists, ExpandAfterDirectArgumentsInOptionOrder) {
    fs::path dir = fs::temp_directory_path() / ("ox_lists_" + std::to_string(::getpid()));
    fs::create_directories(dir);
    writeList(dir / "a.xml", {"scene1.xml", "mesh1.vtm"});
    writeList(dir / "b.xml", {"scene2.xml"});
    writeList(dir / "pc.xml", {"p1.pc", "p2.pc"});
    writeList(dir / "img.xml", {"i1.exr"});
    std::string a = (dir / "a.xml").string(), b = (dir / "b.xml").string();
    std::string pc = (dir / "pc.xml").string(), img = (dir / "img.xml").string();

    ox::CommandLineOptions o;
    ASSERT_TRUE(ox::parseCommandLine({"thevorn", "-i", b, "direct.xml", "-i", a, "-pi", pc, "-ri",
                                      img, "-rm", "target", "i0.exr"},
                                     ox::loadInputList, o));
    EXPECT_EQ(o.inputFiles,
              (std::vector<std::string>{"direct.xml", "scene2.xml", "scene1.xml", "mesh1.vtm"}));
    EXPECT_EQ(o.pointCloudInputs, (std::vector<std::string>{"p1.pc", "p2.pc"}));
    EXPECT_EQ(o.imageInputs, (std::vector<std::string>{"i0.exr", "i1.exr"}));

    // A list that cannot be read fails the command line with both lines.
    ox::CommandLineOptions bad;
    testing::internal::CaptureStdout();
    EXPECT_FALSE(ox::parseCommandLine({"thevorn", "s.xml", "-i", (dir / "missing.xml").string()},
                                      ox::loadInputList, bad));
    std::string out = testing::internal::GetCapturedStdout();
    EXPECT_NE(out.find("Unable to load input file list from file: "), std::string::npos);
    EXPECT_NE(out.find("Unable to build list of input files."), std::string::npos);
    fs::remove_all(dir);
}
