// The configuration files of the built program: -c, -xs and -x, checked through the program the
// way a user runs it, with the schema checked by xmllint.
#include <gtest/gtest.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <sstream>

namespace fs = std::filesystem;

namespace {

struct Outcome {
    int exitCode = -1;
    std::string out;
};

class ConfigFiles : public ::testing::Test {
protected:
    void SetUp() override {
        dir_ = fs::temp_directory_path() /
               ("ox_config_files_" + std::to_string(::getpid()) + "_" +
                ::testing::UnitTest::GetInstance()->current_test_info()->name());
        fs::remove_all(dir_);
        fs::create_directories(dir_);
    }
    void TearDown() override { fs::remove_all(dir_); }

    Outcome shell(const std::string &command) {
        const std::string full = "cd '" + dir_.string() + "' && " + command + " > out.txt 2>&1";
        const int status = std::system(full.c_str());
        Outcome o;
        o.exitCode = WIFEXITED(status) ? WEXITSTATUS(status) : -1;
        o.out = read("out.txt");
        return o;
    }
    Outcome thevorn(const std::string &args) {
        return shell("'" OX_BINARY_DIR "/app/thevorn' " + args);
    }
    std::string read(const std::string &name) {
        std::ifstream in(dir_ / name, std::ios::binary);
        std::stringstream s;
        s << in.rdbuf();
        return s.str();
    }
    void write(const std::string &name, const std::string &text) {
        std::ofstream(dir_ / name, std::ios::binary) << text;
    }
    fs::path dir_;
};

}  // namespace

TEST_F(ConfigFiles, DefaultConfigurationAndSchemaAgree) {
    write("config.xml", "old");
    Outcome c = thevorn("-c");
    ASSERT_EQ(c.exitCode, 0) << c.out;
    EXPECT_NE(c.out.find("Writing a default xml file (config.xml)"), std::string::npos);
    const std::string xml = read("config.xml");
    EXPECT_EQ(xml.rfind("<?xml version=\"1.0\" encoding=\"ISO-8859-1\"?>\n<OXConfig>\n\t<", 0), 0u);
    EXPECT_NE(xml.find("\t<FrameSettings>\n"), std::string::npos);
    EXPECT_NE(xml.find("<renderThreads>2</renderThreads>"), std::string::npos);
    EXPECT_NE(xml.find("<renderType>Render</renderType>"), std::string::npos);

    Outcome s = thevorn("-xs");
    ASSERT_EQ(s.exitCode, 0) << s.out;
    EXPECT_NE(read("config.xsd").find("xmlns:xsd=\"http://www.w3.org/2001/XMLSchema\""),
              std::string::npos);
    Outcome lint = shell("xmllint --noout --schema config.xsd config.xml");
    EXPECT_EQ(lint.exitCode, 0) << lint.out;

    // The written configuration loads back without a single reader warning.
    Outcome load = thevorn("scene.xml -x config.xml -od out");
    EXPECT_EQ(load.out.find("Unable to load settings"), std::string::npos) << load.out;
    for (const char *w : {"unknown node", "could not set value", "Type conversion error"})
        EXPECT_EQ(load.out.find(w), std::string::npos) << load.out;
    EXPECT_NE(load.exitCode, 3);
}

TEST_F(ConfigFiles, LoadingOverTheDefaults) {
    write("min.xml",
          "<OXConfig><FrameSettings><renderType>\n  TextureBake \n</renderType>"
          "</FrameSettings><Bogus/></OXConfig>");
    Outcome ok = thevorn("scene.xml -x min.xml -od out");
    EXPECT_NE(ok.exitCode, 3) << ok.out;
    EXPECT_EQ(ok.out.find("Unable to load settings"), std::string::npos) << ok.out;
    EXPECT_NE(ok.out.find("Warning, unknown node: Bogus"), std::string::npos) << ok.out;

    write("broken.xml", "<OXConfig><FrameSettings></OXConfig>");
    for (const std::string file : {"broken.xml", "missing.xml", "."}) {
        Outcome bad = thevorn("scene.xml -x " + file);
        EXPECT_EQ(bad.exitCode, 3) << bad.out;  // status 0x20000003
        EXPECT_NE(bad.out.find("[ERROR]    Unable to load settings from file " + file),
                  std::string::npos)
            << bad.out;
    }
}

TEST_F(ConfigFiles, AFailedWriteReturnsTheSystemErrorAndLeavesNothingBehind) {
    fs::create_directories(dir_ / "config.xml");
    Outcome c = thevorn("-c");
    EXPECT_EQ(c.exitCode, 21) << c.out;  // EISDIR
    EXPECT_NE(c.out.find("Unable to write config.xml"), std::string::npos) << c.out;
    EXPECT_TRUE(fs::is_directory(dir_ / "config.xml"));
    for (const auto &e : fs::directory_iterator(dir_))
        EXPECT_EQ(e.path().filename().string().find(".tmp"), std::string::npos);
}
