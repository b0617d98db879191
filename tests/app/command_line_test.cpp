#include "app/command_line.h"

#include <gtest/gtest.h>

namespace {

using Args = std::vector<std::string>;

struct Parsed {
    bool ok;
    std::string out;
    ox::CommandLineOptions options;
};

/// Parses the arguments after the program name, expecting success (or failure when !expectOk).
Parsed parse(Args args, const ox::InputListLoader &loader = ox::loadNoInputList,
             bool expectOk = true) {
    args.insert(args.begin(), "thevorn");
    Parsed p;
    testing::internal::CaptureStdout();
    p.ok = ox::parseCommandLine(args, loader, p.options);
    p.out = testing::internal::GetCapturedStdout();
    EXPECT_EQ(p.ok, expectOk) << p.out;
    return p;
}

TEST(CommandLine, PlainArgumentsAndFlags) {
    Parsed p = parse({"scene.xml", "", "-o", "", "-x", "c.xml"});
    EXPECT_EQ(p.out, "");
    const ox::CommandLineOptions &o = p.options;
    EXPECT_EQ(o.inputFiles, (Args{"scene.xml", ""}));  // an empty argument is an input file
    EXPECT_EQ(o.outputFile, "");
    EXPECT_EQ(o.configFiles, Args{"c.xml"});

    p = parse({"s.xml", "-b", "-me", "-d", "-q", "-cs", "-pat", "x", "-p", "l", "-rt", "12abc"});
    EXPECT_EQ(p.options.action, ox::kActionTextureBake);
    EXPECT_EQ(p.options.fileFormat, ox::kFormatExrMultiLayer);
    EXPECT_FALSE(p.options.showDisplay);
    EXPECT_TRUE(p.options.quitWhenDone);
    EXPECT_TRUE(p.options.crashSilently);
    EXPECT_EQ(p.options.patArgument, "x");
    EXPECT_EQ(p.options.priority, ox::kCommandPriorityLow);
    EXPECT_EQ(p.options.renderThreads, 12);  // stream extraction stops at the letters
}

TEST(CommandLine, OutputDirectoryAndMergeArguments) {
    EXPECT_EQ(parse({"s", "-od", "out"}).options.outputDirectory, "out/");
    EXPECT_EQ(parse({"s", "-od", "out/"}).options.outputDirectory, "out/");
    EXPECT_EQ(parse({"s", "-od", "out\\"}).options.outputDirectory, "out\\");

    Parsed p = parse({"-pmpt", "0.5", "2", "a.pc", "b.pc", "-o", "m"});
    EXPECT_EQ(p.options.action, ox::kActionPathTracerMerge);
    EXPECT_FLOAT_EQ(p.options.mergeParam1, 0.5f);
    EXPECT_FLOAT_EQ(p.options.mergeParam2, 2.0f);
    EXPECT_EQ(p.options.pointCloudInputs, (Args{"a.pc", "b.pc"}));

    p = parse({"-pmb", "3", "a.pc"});
    EXPECT_EQ(p.options.action, ox::kActionPointCloudMergeB);
    EXPECT_FLOAT_EQ(p.options.mergeParam1, 3.0f);

    p = parse({"s.xml", "-rm", "wall", "a.exr", "b.exr", "-t"});
    EXPECT_EQ(p.options.action, ox::kActionRegionMerge);
    EXPECT_EQ(p.options.mergeTarget, "wall");
    EXPECT_EQ(p.options.imageInputs, (Args{"a.exr", "b.exr"}));
    EXPECT_EQ(p.options.inputFiles, Args{"s.xml"});

    p = parse({"-spl", "4"});
    EXPECT_EQ(p.options.action, ox::kActionSplitConfig);
    EXPECT_EQ(p.options.splitCount, 4);
}

TEST(CommandLine, InputListsAreExpandedAfterDirectArguments) {
    std::vector<std::string> asked;
    const ox::InputListLoader loader = [&](const std::string &file, std::vector<std::string> &out) {
        asked.push_back(file);
        if (file == "bad.xml") return false;
        out.push_back(file + ":1");
        out.push_back(file + ":2");
        return true;
    };
    Parsed p =
        parse({"-i", "a.xml", "s.xml", "-i", "b.xml", "-ri", "r.xml", "-im", "t", "x.exr"}, loader);
    EXPECT_EQ(p.options.inputFiles, (Args{"s.xml", "a.xml:1", "a.xml:2", "b.xml:1", "b.xml:2"}));
    EXPECT_EQ(p.options.imageInputs, (Args{"x.exr", "r.xml:1", "r.xml:2"}));
    EXPECT_EQ(asked, (Args{"a.xml", "b.xml", "r.xml"}));

    // A list alone satisfies the merge's need for inputs.
    p = parse({"-pm", "-pi", "p.xml"}, loader);
    EXPECT_EQ(p.options.pointCloudInputs, (Args{"p.xml:1", "p.xml:2"}));

    // A list that cannot be read fails the command line (messages: the program's own tests).
    parse({"s", "-ri", "bad.xml"}, loader, false);
    parse({"s", "-i", "a.xml"}, ox::loadNoInputList, false);  // without a configuration reader
}

}  // namespace
