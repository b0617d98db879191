#include "app/run.h"

#include <gtest/gtest.h>
#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <fstream>

#include "app/exit_status.h"
#include "core/message.h"
#include "tests/app/app_test_util.h"
#include "tests/support/test_support.h"

namespace {

using apptest::RecordingDriver;

class RunTest : public oxtest::TempDirTest {
protected:
    RunTest() : TempDirTest("ox_run_test_") {}
};

TEST(ExitStatus, LowByteMapping) {
    for (int nn : {2, 3, 4, 5, 7, 8, 9, 10, 12, 13})
        EXPECT_EQ(ox::processExitCode(0x20000000 + nn), nn);
    const std::pair<int32_t, int> other[] = {
        {0, 0},          {ox::kStatusFailure, 1}, {0x20000001, 1},          {0x20000006, 1},
        {0x20000100, 1}, {ENOENT, ENOENT},        {EACCES, EACCES},         {256, 1},
        {-5, 1},         {ox::kStatusCrash, 139}, {ox::kStatusAborted, 199}};
    for (const auto &[status, code] : other) EXPECT_EQ(ox::processExitCode(status), code) << status;
    EXPECT_EQ(ox::statusFromPlatformError(0), ox::kStatusFailure);
    EXPECT_EQ(ox::statusFromPlatformError(EACCES), EACCES);
}

TEST(RunSteps, ActionsFromAndIntoRenderType) {
    const int32_t fromType[] = {1, 2, 4, 3, 5, 16};
    for (int32_t type = 0; type < 6; ++type) {
        ox::DefaultRunSettings s;
        s.renderTypeValue = type;
        EXPECT_EQ(ox::resolveAction(ox::kActionNone, s), fromType[type]);
        EXPECT_EQ(s.fgUseLegacy, type == 2 || type == 4 || type == 5);
    }
    const std::pair<int32_t, int32_t> intoType[] = {{1, 0}, {2, 1},  {3, 3},  {4, 2},
                                                    {5, 4}, {16, 5}, {17, 3}, {19, 3}};
    for (const auto &[action, type] : intoType) {
        ox::DefaultRunSettings s;
        s.renderTypeValue = 3;
        EXPECT_EQ(ox::resolveAction(action, s), action);
        EXPECT_EQ(s.renderTypeValue, type) << action;
    }
    ox::DefaultRunSettings bad;
    bad.renderTypeValue = 9;
    EXPECT_EQ(ox::resolveAction(ox::kActionNone, bad), ox::kActionNone);

    EXPECT_EQ(ox::resolveFileFormat(ox::kFormatNone, 0), ox::kFormatTga);
    EXPECT_EQ(ox::resolveFileFormat(ox::kFormatNone, 2), ox::kFormatExr);
    EXPECT_EQ(ox::resolveFileFormat(ox::kFormatNone, 1), ox::kFormatExr);  // PPM
    EXPECT_EQ(ox::resolveFileFormat(ox::kFormatNone, 7), ox::kFormatExrMultiLayer);
    EXPECT_EQ(ox::resolveFileFormat(ox::kFormatJpeg, 7), ox::kFormatJpeg);
}

TEST(RunSteps, ThreadCountsAreClampedIn64BitsAndWrittenBack) {
    ox::resetMessageFilters();
    const std::string outside = "[WARNING]  The render thread count ";
    const struct {
        int64_t option, subtract;  // -rt (-1: none) and autoThreadsSubtract
        bool autoThreads;
        int64_t configured, want;
        std::string printed;
    } cases[] = {
        {-1, 10, true, 0, 1, "[INFO]     Detected 8 cores, using 1 cores\n"},
        {-1, 4294967295LL, true, 0, 1, "[INFO]     Detected 8 cores, using 1 cores\n"},
        {-1, 0, false, 6, 6, ""},
        {-1, 0, false, 0, 1, outside + "0 is outside 1 to 1024, using 1\n"},
        {0, 0, true, 6, 1, outside + "0 is outside 1 to 1024, using 1\n"},  // -rt wins
        {5000000000LL, 0, true, 6, 1024, outside + "5000000000 is outside 1 to 1024, using 1024\n"},
        {3, 0, true, 6, 3, ""}};
    for (const auto &c : cases) {
        ox::DefaultRunSettings s;
        s.autoThreadsSubtractValue = c.subtract;
        s.autoThreadsValue = c.autoThreads;
        s.renderThreadsValue = c.configured;
        testing::internal::CaptureStdout();
        EXPECT_EQ(ox::resolveRenderThreads(c.option, s, 8), c.want) << c.option;
        EXPECT_EQ(testing::internal::GetCapturedStdout(), c.printed);
        EXPECT_EQ(s.renderThreadsValue, c.want);
    }
}

TEST_F(RunTest, CacheFilesArePrefixedWithTheirFolder) {
    ox::DefaultRunSettings s;
    s.setCacheFile(ox::CacheFile::kFinalGather, "fg.pc");
    s.setCacheFile(ox::CacheFile::kCausticsPhotonMap, "c.pm");
    s.setCacheFile(ox::CacheFile::kOcclusionMap, "o.occ");
    EXPECT_EQ(ox::prepareOutputTree("deep/out/", s), 0);
    EXPECT_EQ(s.cacheFile(ox::CacheFile::kFinalGather), "deep/out/GI/fgMaps/fg.pc");
    EXPECT_EQ(s.cacheFile(ox::CacheFile::kCausticsPhotonMap), "deep/out/GI/photonMaps/c.pm");
    EXPECT_EQ(s.cacheFile(ox::CacheFile::kOcclusionMap), "deep/out/GI/occMaps/o.occ");
    EXPECT_EQ(s.cacheFile(ox::CacheFile::kPathTracer), "");  // no name, no prefix
}

TEST_F(RunTest, InputChecks) {
    ox::DefaultRunSettings s;
    EXPECT_EQ(ox::checkInputs(ox::kActionRender, s), 0);

    s.inputCheck.vertexBakeLightPasses = 1;
    testing::internal::CaptureStdout();
    EXPECT_EQ(ox::checkInputs(ox::kActionVertexBake, s), ox::kStatusUnsupported);
    EXPECT_EQ(ox::checkInputs(ox::kActionVertexTransfer, s), 0);
    EXPECT_EQ(testing::internal::GetCapturedStdout(),
              "[ERROR]    Light passes are not supported together with vertex bakes. Use vertex "
              "transfer instead!\n");
    s.inputCheck.vertexBakeLightPasses = 0;

    s.renderTypeValue = 1;
    s.inputCheck.firstTextureBakeTarget = ox::TargetSize{"wall", 512, 0};
    s.inputCheck.firstSurfaceTransferTarget = ox::TargetSize{"hi", 0, 0};
    testing::internal::CaptureStdout();
    EXPECT_EQ(ox::checkInputs(ox::kActionTextureBake, s), ox::kStatusZeroDimension);
    s.renderTypeValue = 3;
    EXPECT_EQ(ox::checkInputs(ox::kActionSurfaceTransfer, s), ox::kStatusZeroDimension);
    EXPECT_EQ(testing::internal::GetCapturedStdout(),
              "[ERROR]    BakeTextureTarget 'wall' with invalid dimension 512x0.\n\n"
              "[ERROR]    SurfaceTransferTexture 'hi' with invalid dimension 0x0.\n\n");
    s.renderTypeValue = 0;

    // The final-gather irradiance cache is looked for with its suffix, only when it is read.
    s.setCacheFile(ox::CacheFile::kFinalGather, "fg");
    s.inputCheck.enableGI = true;
    s.inputCheck.secondaryIntegrator = ox::kIntegratorFinalGather;
    s.inputCheck.finalGatherCacheKind = 1;
    s.inputCheck.finalGatherCacheMode = 1;  // computes, reads nothing
    EXPECT_EQ(ox::checkInputs(ox::kActionRender, s), 0);
    s.inputCheck.finalGatherCacheMode = 2;
    testing::internal::CaptureStdout();
    EXPECT_EQ(ox::checkInputs(ox::kActionRender, s), ENOENT);
    EXPECT_EQ(testing::internal::GetCapturedStdout(),
              "[ERROR]    Unable to read fg irradiance file 'fg.irradiance'.\n");
    std::ofstream("fg.irradiance") << "x";
    EXPECT_EQ(ox::checkInputs(ox::kActionRender, s), 0);
    s.inputCheck.enableGI = false;

    // The first missing file of the table is the one reported.
    s.inputCheck.imageBasedEnvironment = true;
    s.inputCheck.environmentImageFile = "sky.hdr";
    s.inputCheck.causticsPhotonMapMode = 3;
    s.setCacheFile(ox::CacheFile::kCausticsPhotonMap, "caustics.pm");
    testing::internal::CaptureStdout();
    EXPECT_EQ(ox::checkInputs(ox::kActionRender, s), ENOENT);
    s.inputCheck.imageBasedEnvironment = false;
    EXPECT_EQ(ox::checkInputs(ox::kActionRender, s), ENOENT);
    s.inputCheck.causticsPhotonMapMode = 0;
    s.inputCheck.textureBakeUsesLua = true;
    s.inputCheck.textureBakeLuaFile = ".";  // a directory cannot be read as a file
    EXPECT_EQ(ox::checkInputs(ox::kActionRender, s), 0);
    EXPECT_EQ(ox::checkInputs(ox::kActionSurfaceTransfer, s), EISDIR);
    EXPECT_EQ(testing::internal::GetCapturedStdout(),
              "[ERROR]    Unable to read ibl environment file 'sky.hdr'.\n"
              "[ERROR]    Unable to read caustics photon map file 'caustics.pm'.\n"
              "[ERROR]    Unable to read texture bake lua settings '.'.\n");
}

TEST_F(RunTest, TheRunPlugsInDriversListsAndSettings) {
    auto driver = std::make_shared<RecordingDriver>();
    ox::RunEnvironment env;
    env.makeSettings = [&] {
        auto s = std::make_unique<ox::DefaultRunSettings>();
        s->verbosity.debugFile = true;
        s->verbosity.benchmarkPrint = true;
        s->renderTypeValue = 4;  // VertexTransfer
        return s;
    };
    env.loadInputList = [](const std::string &, std::vector<std::string> &out) {
        out.push_back("listed.xml");
        return true;
    };
    env.processorCount = [] { return 3; };
    env.drivers.set(ox::kActionVertexTransfer, driver);

    testing::internal::CaptureStdout();
    const int32_t status =
        ox::runThevorn({"thevorn", "-i", "list.xml", "-od", "out", "-o", "base"}, env);
    const std::string out = testing::internal::GetCapturedStdout();
    EXPECT_EQ(status, 0) << out;
    EXPECT_EQ(driver->actions, std::vector<int32_t>{ox::kActionVertexTransfer});
    EXPECT_EQ(driver->baseName, "base");
    EXPECT_EQ(driver->directory, "out/");
    EXPECT_EQ(driver->format, ox::kFormatTga);
    EXPECT_EQ(driver->threads, 3);
    EXPECT_TRUE(driver->fgUseLegacy);
    EXPECT_EQ(driver->renderType, 4);
    EXPECT_NE(out.find("[BENCH]    Statistics for this run:\n[BENCH]    Pass 1: beauty ("),
              std::string::npos)
        << out;
    // The output tree came first, so the debug file starts with its banner.
    const std::string debug = apptest::readFile("out/debug.out");
    EXPECT_EQ(debug.rfind(" +++++++++++++++ KESTRIN RENDERER DEBUG MESSAGES +++++++++++ \n", 0),
              0u);
    EXPECT_NE(debug.find("[PROGRESS] Progress 100.0%\n"), std::string::npos);

    // A driver's status is the run's; an action without a driver says so.
    driver->result = ox::kStatusAborted;
    testing::internal::CaptureStdout();
    EXPECT_EQ(ox::runThevorn({"thevorn", "s.xml", "-vt"}, env), ox::kStatusAborted);
    env.drivers.set(ox::kActionRender, driver);
    EXPECT_EQ(ox::runThevorn({"thevorn", "s.xml", "-r", "-d", "-q"}, env), ox::kStatusAborted);
    EXPECT_EQ(driver->renderType, 0);  // the option was written back before the driver ran
    EXPECT_FALSE(driver->fgUseLegacy);
    EXPECT_EQ(ox::runThevorn({"thevorn", "s.xml", "-b"}, env), ox::kStatusUnsupported);
    // Without an action option the configuration chose it: the message names that setting.
    env.drivers.set(ox::kActionVertexTransfer, nullptr);
    EXPECT_EQ(ox::runThevorn({"thevorn", "s.xml"}, env), ox::kStatusUnsupported);
    const std::string out2 = testing::internal::GetCapturedStdout();
    EXPECT_NE(out2.find("[ERROR]    The texture bake (-b) is not available: this build has no "
                        "driver for it.\n"),
              std::string::npos)
        << out2;
    EXPECT_NE(out2.find("[ERROR]    The vertex surface transfer (renderType VertexTransfer) is not "
                        "available: this build has no driver for it.\n"),
              std::string::npos)
        << out2;
}

TEST(CrashHandler, SilentCrashExitsWith139) {
    for (bool silent : {true, false}) {
        const pid_t child = ::fork();
        ASSERT_GE(child, 0);
        if (child == 0) {
            ox::installCrashHandler(silent);
            ::raise(SIGSEGV);
            ::_exit(0);
        }
        int status = 0;
        ASSERT_EQ(::waitpid(child, &status, 0), child);
        if (silent) {
            ASSERT_TRUE(WIFEXITED(status));
            EXPECT_EQ(WEXITSTATUS(status), 139);
        } else {
            ASSERT_TRUE(WIFSIGNALED(status));
            EXPECT_EQ(WTERMSIG(status), SIGSEGV);
        }
    }
}

}  // namespace
