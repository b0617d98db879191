// The camera/bake driver over a fake run: step lines, prepasses, statuses, aborts, the region
// and name checks, written files; the split and the configuration writer.
#include "app/camera_bake_driver.h"

#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>

#include "app/config_run_settings.h"
#include "app/exit_status.h"
#include "app/frame_writer.h"
#include "config/xml.h"
#include "core/render_io_console.h"
#include "render/frame.h"
#include "tests/app/app_test_util.h"
#include "tests/support/test_support.h"

namespace {

using testing::internal::CaptureStdout;
using testing::internal::GetCapturedStdout;

/// What the fake run and writer were asked to do, in order.
struct Journal {
    std::vector<std::string> events;
};

struct FakeRun : ox::HLRenderInterface {
    FakeRun(Journal &j, std::vector<std::string> targets, std::vector<std::string> passes)
        : journal(j), targets(std::move(targets)), passes(std::move(passes)) {}
    std::vector<std::string> componentPasses() const override { return passes; }
    int32_t prepare(const std::vector<std::string> &p) override {
        journal.events.push_back("prepare " + std::to_string(p.size()));
        return prepareResult;
    }
    int32_t targetCount() const override { return int32_t(targets.size()); }
    std::string targetName(int32_t i) const override { return targets[size_t(i)]; }
    int32_t setupTarget(int32_t i) override {
        current = i;
        return ox::kRunDone;
    }
    ox::Vec2i frameSize() const override { return {8 + current, 4}; }
    ox::Frame *frame() override { return nullptr; }
    int32_t prepassCount() const override { return prepasses; }
    int32_t giPrepass(int32_t p, ox::RenderIOInterface &) override {
        journal.events.push_back("prepass " + std::to_string(p) + " " + targets[size_t(current)]);
        return ox::kRunDone;
    }
    int32_t renderTarget(int32_t pass, ox::RenderIOInterface &io) override {
        journal.events.push_back("render " + std::to_string(pass) + " " + targets[size_t(current)]);
        ++rendered;
        if (rendered == abortAt) io.abort();
        return rendered == failAt ? failResult : ox::kRunDone;
    }
    void statistics(ox::RunStatistics &s) override { s.count("Primary rays", 10); }

    Journal &journal;
    std::vector<std::string> targets, passes;
    int32_t current = -1, prepasses = 0, prepareResult = 0, rendered = 0, abortAt = -1, failAt = -1,
            failResult = 0;
};

struct FakeFactory : ox::RenderRunFactoryInterface, ox::TargetWriterInterface {
    bool supports(int32_t) const override { return true; }
    bool loadScene(const std::vector<std::string> &, ox::OXConfig &config, int64_t,
                   std::string &error) override {
        config.RenderSettings.bias = 0.25f;  // as the automatic bias does
        error = "no such scene";
        return loads;
    }
    bool packUVs(ox::OXConfig &, bool &changed, std::string &) override {
        changed = false;
        return true;
    }
    std::unique_ptr<ox::HLRenderInterface> createRun(int32_t, const ox::OXConfig &,
                                                     int64_t) override {
        auto run = std::make_unique<FakeRun>(journal, targets, passes);
        setUp(*run);
        return run;
    }
    ox::TargetWriterInterface &writer() override { return *this; }
    bool writeLayer(ox::Frame *, int32_t format, const std::string &dir, const std::string &base,
                    const std::string &target, const std::string &layer,
                    const ox::OXConfigBase &) override {
        journal.events.push_back("write " + dir + base + "_" + target + "_" + layer);
        return writes;
    }
    bool writeMultiLayer(ox::Frame *, const std::string &file, const ox::OXConfigBase &) override {
        journal.events.push_back("multi " + file);
        return writes;
    }
    bool writeMinMaxData(ox::Frame *, const std::string &) override { return true; }

    Journal journal;
    std::vector<std::string> targets{"t1", "t2", "t3"};
    std::vector<std::string> passes{"p1", "p2"};
    std::function<void(FakeRun &)> setUp = [](FakeRun &) {};
    bool loads = true, writes = true;
};

class DriverTest : public oxtest::TempDirTest {
protected:
    DriverTest() : TempDirTest("ox_driver_test_") {}

    /// Runs action with the fake; the console text is kept in output.
    int32_t run(int32_t action = ox::kActionTextureBake) {
        ox::RioImpl progress(ox::RioImpl::kDefaultStep);
        ox::RunStatistics statistics("Vorn");
        ox::RunContext context{options,  settings, progress, statistics, "out/",
                               baseName, format,   2,        &preview};
        ox::CameraBakeDriver driver(factory);
        CaptureStdout();
        const int32_t status = driver.run(action, context);
        output = GetCapturedStdout();
        aborted = progress.isAborted();
        return status;
    }
    bool has(const std::string &text) const { return output.find(text) != std::string::npos; }
    const std::vector<std::string> &events() const { return factory->journal.events; }

    ox::CommandLineOptions options;
    ox::ConfigRunSettings settings;
    std::shared_ptr<FakeFactory> factory = std::make_shared<FakeFactory>();
    std::unique_ptr<ox::PreviewObserverInterface> preview;
    int32_t format = ox::kFormatExr;
    std::string baseName = "base";
    std::string output;
    bool aborted = false;
};

TEST_F(DriverTest, TwoPassesOverThreeTargetsRunSixNumberedSteps) {
    ASSERT_EQ(run(), ox::kStatusSuccess);
    const char *lines[] = {
        "[1/6] Rendering t1 [Target 1/3] [Pass 1/2]", "[2/6] Rendering t2 [Target 2/3] [Pass 1/2]",
        "[3/6] Rendering t3 [Target 3/3] [Pass 1/2]", "[4/6] Rendering t1 [Target 1/3] [Pass 2/2]",
        "[5/6] Rendering t2 [Target 2/3] [Pass 2/2]", "[6/6] Rendering t3 [Target 3/3] [Pass 2/2]"};
    size_t at = 0;
    for (const char *line : lines) {
        at = output.find(std::string("[INFO]     ") + line + ", total elapsed time: ", at);
        ASSERT_NE(at, std::string::npos) << line << "\n" << output;
    }
    EXPECT_TRUE(has("[PROGRESS] Done rendering! Total render time: "));
    EXPECT_FALSE(aborted);  // no -q
    const std::vector<std::string> expected = {"prepare 2",
                                               "render 0 t1",
                                               "write out/base_t1_p1",
                                               "render 0 t2",
                                               "write out/base_t2_p1",
                                               "render 0 t3",
                                               "write out/base_t3_p1",
                                               "render 1 t1",
                                               "write out/base_t1_p2",
                                               "render 1 t2",
                                               "write out/base_t2_p2",
                                               "render 1 t3",
                                               "write out/base_t3_p2"};
    EXPECT_EQ(events(), expected);
    // The null observer stands in the run's slot with the size of the last target.
    auto *observer = dynamic_cast<ox::NullPreviewObserver *>(preview.get());
    ASSERT_NE(observer, nullptr);
    EXPECT_EQ(observer->width(), 10);

    // -q aborts the progress object after the last step, so that a preview closes.
    options.quitWhenDone = true;
    ASSERT_EQ(run(), ox::kStatusSuccess);
    EXPECT_TRUE(aborted);
    // Multi-layer EXR: one file per target, written once after the target's last pass (which
    // keeps the earlier passes' layers), so that no pass overwrites another.
    format = ox::kFormatExrMultiLayer;
    factory->journal.events.clear();
    ASSERT_EQ(run(), ox::kStatusSuccess);
    const auto &e = events();
    EXPECT_EQ(std::count(e.begin(), e.end(), "multi out/base_t2.exr"), 1);
    const auto multi = std::find(e.begin(), e.end(), "multi out/base_t2.exr");
    ASSERT_NE(multi, e.end());
    EXPECT_EQ(*(multi - 1), "render 1 t2");
}

TEST_F(DriverTest, PrepassesRunOverEveryTargetBeforeTheMainLoop) {
    factory->setUp = [](FakeRun &r) { r.prepasses = 2; };
    ASSERT_EQ(run(), ox::kStatusSuccess);
    for (int i = 1; i <= 6; ++i)
        EXPECT_TRUE(has("[INFO]     Rendering prepass " + std::to_string(i) + " / 6\n")) << i;
    EXPECT_EQ(events()[1], "prepass 0 t1");
    EXPECT_EQ(events()[6], "prepass 1 t3");
    EXPECT_EQ(events()[7], "render 0 t1");
    // Only the prepasses when GI asks for nothing else.
    settings.config().GISettings.enableGI = true;
    settings.config().GISettings.renderGIPrepassOnly = true;
    factory->journal.events.clear();
    ASSERT_EQ(run(), ox::kStatusSuccess);
    EXPECT_EQ(events().size(), 7u);
}

TEST_F(DriverTest, FailuresAndAbortsEndTheRunWithTheirStatus) {
    // An abort during the second target keeps what the first wrote and writes nothing more.
    factory->setUp = [](FakeRun &r) { r.abortAt = 2; };
    EXPECT_EQ(run(), ox::kStatusAborted);
    EXPECT_EQ(events().back(), "render 0 t2");
    EXPECT_EQ(std::count(events().begin(), events().end(), "write out/base_t1_p1"), 1);
    EXPECT_FALSE(has("Done rendering"));

    const struct {
        std::function<void(FakeRun &)> setUp;
        int32_t status;
    } cases[] = {
        {[](FakeRun &r) { r.failAt = 3, r.failResult = ox::kRunHardError; }, ox::kStatusFailure},
        {[](FakeRun &r) { r.failAt = 1, r.failResult = 1; }, ox::kStatusAborted},
        {[](FakeRun &r) { r.prepareResult = ox::kRunHardError; }, ox::kStatusFailure},
        {[](FakeRun &r) { r.prepareResult = 1; }, ox::kStatusAborted},
        {[](FakeRun &r) { r.passes.clear(); }, ox::kStatusNoComponents},
        {[](FakeRun &r) { r.targets[1] = "../up"; }, ox::kStatusFailure},
        {[](FakeRun &r) { r.targets[2] = "a\\b"; }, ox::kStatusFailure},
        {[](FakeRun &r) { r.passes[0] = "x/y"; }, ox::kStatusFailure},
    };
    for (const auto &c : cases) {
        factory->journal.events.clear();
        factory->setUp = c.setUp;
        EXPECT_EQ(run(), c.status) << output;
    }
    // A name that would leave the output directory is refused before anything renders.
    factory->setUp = [](FakeRun &) {};
    factory->targets = {"ok", ".."};
    factory->journal.events.clear();
    EXPECT_EQ(run(), ox::kStatusFailure);
    EXPECT_TRUE(has("The target name '..' cannot be part of a file name"));
    EXPECT_EQ(events(), std::vector<std::string>{"prepare 2"});
    factory->targets = {"t1"};

    factory->writes = false;
    EXPECT_EQ(run(), ox::kStatusImageWrite);
    factory->writes = true;
    // The directory of the base name is made before rendering; when it cannot be, nothing
    // renders.
    std::ofstream("out/blocked") << "a file";
    baseName = "blocked/pic";
    factory->journal.events.clear();
    EXPECT_EQ(run(), ox::kStatusImageWrite);
    EXPECT_TRUE(has("[ERROR]    Unable to create the output directory out/blocked/"));
    EXPECT_EQ(events(), std::vector<std::string>{"prepare 2"});
    baseName = "sub/pic";
    EXPECT_EQ(run(), ox::kStatusSuccess);
    EXPECT_TRUE(std::filesystem::is_directory("out/sub"));
    baseName = "base";
    factory->writes = true;
    factory->loads = false;
    EXPECT_EQ(run(), ox::kStatusFailure);
    EXPECT_TRUE(has("[ERROR]    no such scene: "));
}

TEST_F(DriverTest, RegionWithoutAreaOnEitherAxisIsRefused) {
    ox::FrameSettingsBase &frame = settings.config().FrameSettings;
    frame.regionRender = true;
    frame.resolution = ox::Vec2i{64, 32};
    const std::pair<ox::Vec2i, ox::Vec2i> bad[] = {
        {{10, 10}, {5, 20}},   // inverted along x
        {{10, 20}, {20, 10}},  // inverted along y
        {{10, 10}, {10, 20}},  // no width
        {{70, 0}, {80, 10}},   // outside along x
        {{0, 40}, {10, 50}},   // outside along y
    };
    for (const auto &[lo, hi] : bad) {
        frame.regionLowerLeft = lo;
        frame.regionTopRight = hi;
        EXPECT_EQ(run(ox::kActionRender), ox::kStatusBadRegionOrImage) << lo.x << "," << hi.x;
        EXPECT_TRUE(has("Specified render region has no area or lies outside resolution range."));
    }
    frame.regionLowerLeft = ox::Vec2i{60, 0};
    frame.regionTopRight = ox::Vec2i{100, 1};
    EXPECT_EQ(run(ox::kActionRender), ox::kStatusSuccess);
    EXPECT_TRUE(has("[1/3] Rendering t1 [Target 1/3] [Pass 1/1]"));
}

TEST_F(DriverTest, FramesAreWrittenPerTargetAndLayerOrAllInOneFile) {
    ox::Frame frame(4, 2);
    ASSERT_NE(frame.addTiledLayer<ox::Color>("beauty"), nullptr);
    ASSERT_NE(frame.addTiledLayer<float>("Z"), nullptr);
    std::vector<ox::Color> pixels(8, ox::Color(0.5f, 0.25f, 1.0f, 1.0f));
    ASSERT_TRUE(frame.pasteRegion("beauty", ox::Region(0, 0, 4, 2), pixels.data()));
    ox::FrameTargetWriter writer;
    const ox::OXConfig config;
    std::filesystem::create_directories("out");
    for (int32_t format : {ox::kFormatExr, ox::kFormatJpeg, ox::kFormatTga, ox::kFormatTga24})
        EXPECT_TRUE(writer.writeLayer(&frame, format, "out/", "pic", "cam", "beauty", config));
    for (const char *file :
         {"out/pic_cam_beauty.exr", "out/pic_cam_beauty.jpg", "out/pic_cam_beauty.tga"})
        EXPECT_TRUE(std::filesystem::exists(file)) << file;
    // A layer the frame lacks, and a run without a frame, write nothing and succeed.
    EXPECT_TRUE(writer.writeLayer(&frame, ox::kFormatTga, "out/", "pic", "cam", "tpAO", config));
    EXPECT_FALSE(std::filesystem::exists("out/pic_cam_tpAO.tga"));
    EXPECT_TRUE(writer.writeLayer(nullptr, ox::kFormatTga, "out/", "pic", "cam", "beauty", config));
    EXPECT_TRUE(writer.writeMultiLayer(&frame, "out/pic_cam.exr", config));
    EXPECT_GT(std::filesystem::file_size("out/pic_cam.exr"), 0u);
    EXPECT_FALSE(writer.writeMultiLayer(&frame, "missing/pic_cam.exr", config));
}

class SplitTest : public oxtest::TempDirTest {
protected:
    SplitTest() : TempDirTest("ox_split_test_") {}
    int32_t split(ox::ConfigRunSettings &settings, const std::string &file) {
        ox::CommandLineOptions options;
        options.configFiles = {file};
        ox::RioImpl progress(ox::RioImpl::kDefaultStep);
        ox::RunStatistics statistics("Vorn");
        ox::RunContext context{options, settings, progress, statistics, "./", "result", 1, 1};
        CaptureStdout();
        const int32_t status = ox::SplitDriver().run(ox::kActionSplitConfig, context);
        output = GetCapturedStdout();
        return status;
    }
    std::string output;
};

TEST_F(SplitTest, ThreeTargetBakeSplitsIntoThreeConfigurations) {
    ox::OXConfig config;
    config.FrameSettings.renderType.set(ox::RenderType::TextureBake);
    for (const char *name : {"wall", "floor", "roof"})
        config.TextureBakeSettings.targets.append().textureName = std::string(name);
    ASSERT_TRUE(ox::writeSettings("bake.xml", config));
    ox::ConfigRunSettings settings;
    ASSERT_TRUE(settings.load("bake.xml"));
    // What the run changes before the split never reaches the pieces.
    settings.setRenderThreads(7);
    ASSERT_EQ(split(settings, "bake.xml"), ox::kStatusSuccess) << output;
    const char *names[] = {"wall", "floor", "roof"};
    for (int i = 0; i < 3; ++i) {
        ox::OXConfig piece;
        ASSERT_TRUE(ox::loadSettings("bake.xml." + std::to_string(i), piece));
        ASSERT_EQ(piece.TextureBakeSettings.targets.size(), 1u);
        EXPECT_EQ(piece.TextureBakeSettings.targets[0].textureName(), names[i]);
        EXPECT_EQ(piece.FrameSettings.renderThreads(), 2u);
    }
    EXPECT_FALSE(std::filesystem::exists("bake.xml.3"));

    // A directory that cannot be written: an error, the general failure, no file left behind.
    ASSERT_EQ(split(settings, "missing/bake.xml"), ox::kStatusFailure);
    EXPECT_NE(output.find("[ERROR]    Unable to write the configuration missing/bake.xml.0"),
              std::string::npos);

    ox::ConfigRunSettings render;
    EXPECT_EQ(split(render, "bake.xml"), ox::kStatusUnsupported);
    EXPECT_NE(
        output.find("ERROR: Splitting is not supported for modes other than Vertex Transfer."),
        std::string::npos);
}

TEST_F(SplitTest, WrittenConfigurationsKeepTheKeysTheRunRewrites) {
    ox::OXConfig loaded, running;
    loaded.GISettings.fgFile = std::string("fg.map");
    loaded.RenderSettings.bias = 0.0f;
    copyInto(running, loaded);
    running.GISettings.fgFile = std::string("./GI/fgMaps/fg.map");
    running.GISettings.fgUseLegacy = true;
    running.FrameSettings.renderThreads = 16u;
    running.RenderSettings.bias = 0.02f;
    running.FrameSettings.resolution = ox::Vec2i{32, 16};  // a real change goes out
    ASSERT_EQ(ox::writeRunConfiguration("out.xml", running, loaded), ox::kStatusSuccess);
    ox::OXConfig back;
    ASSERT_TRUE(ox::loadSettings("out.xml", back));
    EXPECT_EQ(back.GISettings.fgFile(), "fg.map");
    EXPECT_FALSE(back.GISettings.fgUseLegacy());
    EXPECT_EQ(back.FrameSettings.renderThreads(), 2u);
    EXPECT_EQ(back.RenderSettings.bias(), 0.0f);
    EXPECT_EQ(back.FrameSettings.resolution(), (ox::Vec2i{32, 16}));
}

}  // namespace
