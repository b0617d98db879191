// Frame layers and image output: paste and read throughput of linear and tiled colour layers
// from one and two threads in 64 x 64 regions, and the multi-layer EXR writer on a 4096 x
// 4096 frame of four colour layers beside OpenEXR writing the same pixels from one buffer.
#include <ImfChannelList.h>
#include <ImfFrameBuffer.h>
#include <ImfHeader.h>
#include <ImfStringAttribute.h>
#include <ImfThreading.h>
#include <ImfTiledOutputFile.h>
#include <benchmark/benchmark.h>
#include <unistd.h>

#include <cstdio>
#include <memory>
#include <string>
#include <vector>

#include "core/message.h"
#include "core/random.h"
#include "render/frame.h"
#include "render/image_writer.h"

namespace {

constexpr int kLayerSize = 2048;  // 64 MiB of colours: beyond every processor cache
constexpr int kRegion = 64;
constexpr int kRegions = (kLayerSize / kRegion) * (kLayerSize / kRegion);

/// The layers under test, made once (by whichever thread asks first).
ox::LayerT<ox::Color> &layerOf(bool tiled) {
    static ox::LinearMemoryLayerT<ox::Color> linear("beauty", kLayerSize, kLayerSize);
    static ox::TiledMemoryLayerT<ox::Color> tiledLayer("beauty", kLayerSize, kLayerSize);
    return tiled ? static_cast<ox::LayerT<ox::Color> &>(tiledLayer) : linear;
}

/// Each thread pastes (or reads) its own share of the 64 x 64 regions, round and round.
template <bool kPaste>
void regionLoop(benchmark::State &state, bool tiled) {
    ox::LayerT<ox::Color> &layer = layerOf(tiled);
    std::vector<ox::Color> buffer(kRegion * kRegion, ox::Color(0.5f, 0.25f, 0.125f, 1.0f));
    const int threads = state.threads(), index = state.thread_index();
    int n = index;
    for (auto _ : state) {
        const int x = (n % (kLayerSize / kRegion)) * kRegion;
        const int y = (n / (kLayerSize / kRegion)) * kRegion;
        const ox::Region r(x, y, x + kRegion, y + kRegion);
        if constexpr (kPaste)
            benchmark::DoNotOptimize(layer.paste(r, buffer.data()));
        else
            benchmark::DoNotOptimize(layer.read(r, buffer.data()));
        n += threads;
        if (n >= kRegions) n = index;
    }
    state.SetBytesProcessed(int64_t(state.iterations()) * kRegion * kRegion * sizeof(ox::Color));
}

void BM_PasteLinear(benchmark::State &state) { regionLoop<true>(state, false); }
void BM_PasteTiled(benchmark::State &state) { regionLoop<true>(state, true); }
void BM_ReadLinear(benchmark::State &state) { regionLoop<false>(state, false); }
void BM_ReadTiled(benchmark::State &state) { regionLoop<false>(state, true); }
BENCHMARK(BM_PasteLinear)->Threads(1)->Threads(2)->UseRealTime();
BENCHMARK(BM_PasteTiled)->Threads(1)->Threads(2)->UseRealTime();
BENCHMARK(BM_ReadLinear)->Threads(1)->Threads(2)->UseRealTime();
BENCHMARK(BM_ReadTiled)->Threads(1)->Threads(2)->UseRealTime();

// --- EXR -------------------------------------------------------------------------------------

constexpr int kImage = 4096;
const char *const kNames[4] = {"beauty", "diffuse", "indirect", "specular"};

/// A smooth picture with a little structure, so that ZIP has realistic work.
const std::vector<ox::Color> &picture() {
    static const std::vector<ox::Color> pixels = [] {
        std::vector<ox::Color> p(size_t(kImage) * kImage);
        for (int y = 0; y < kImage; ++y)
            for (int x = 0; x < kImage; ++x)
                p[size_t(y) * kImage + x] = ox::Color(x / float(kImage), y / float(kImage),
                                                      float((x ^ y) & 255) / 255.0f, 1.0f);
        return p;
    }();
    return pixels;
}

ox::Frame &frame() {
    static std::unique_ptr<ox::Frame> f = [] {
        auto fr = std::make_unique<ox::Frame>(kImage, kImage);
        for (const char *name : kNames)
            fr->addTiledLayer<ox::Color>(name)->paste(ox::Region(0, 0, kImage, kImage),
                                                      picture().data());
        return fr;
    }();
    return *f;
}

std::string outputName(const char *what) {
    const char *dir = std::getenv("TMPDIR");
    return std::string(dir && *dir ? dir : "/tmp") + "/ox_bench_" + what + "_" +
           std::to_string(getpid()) + ".exr";
}

void BM_WriteMultiLayerEXR(benchmark::State &state) {
    ox::Frame &f = frame();
    const std::string name = outputName("multilayer");
    for (auto _ : state)
        if (!ox::writeMultiLayerEXR(name, f, true)) state.SkipWithError("write failed");
    std::remove(name.c_str());
    state.SetBytesProcessed(int64_t(state.iterations()) * 4 * kImage * kImage * 16);
}
BENCHMARK(BM_WriteMultiLayerEXR)->Unit(benchmark::kMillisecond)->Iterations(3)->UseRealTime();

// The same file written by OpenEXR straight from one plain buffer per layer (here the same
// buffer four times): the floor the layer writer is measured against.
void BM_WritePlainEXR(benchmark::State &state) {
    const std::vector<ox::Color> &p = picture();
    const std::string name = outputName("plain");
    for (auto _ : state) {
        Imf::Header header(kImage, kImage, 1.0f, Imath::V2f(0, 0), 1.0f, Imf::INCREASING_Y,
                           Imf::ZIP_COMPRESSION);
        header.setTileDescription(Imf::TileDescription(32, 32, Imf::ONE_LEVEL));
        header.insert(ox::kActiveTilesAttribute, Imf::StringAttribute(std::string(128 * 128, '1')));
        Imf::FrameBuffer fb;
        for (const char *layer : kNames) {
            const char *c = "RGBA";
            for (int k = 0; k < 4; ++k) {
                const std::string channel = std::string(layer) + "." + c[k];
                header.channels().insert(channel, Imf::Channel(Imf::FLOAT));
                // File line y is picture row kImage - 1 - y, as in the layer writer.
                char *base = const_cast<char *>(reinterpret_cast<const char *>(p.data())) +
                             k * sizeof(float) + size_t(kImage - 1) * kImage * sizeof(ox::Color);
                fb.insert(channel, Imf::Slice(Imf::FLOAT, base, sizeof(ox::Color),
                                              size_t(-ptrdiff_t(kImage * sizeof(ox::Color)))));
            }
        }
        Imf::TiledOutputFile out(name.c_str(), header, Imf::globalThreadCount());
        out.setFrameBuffer(fb);
        out.writeTiles(0, out.numXTiles() - 1, 0, out.numYTiles() - 1);
    }
    std::remove(name.c_str());
    state.SetBytesProcessed(int64_t(state.iterations()) * 4 * kImage * kImage * 16);
}
BENCHMARK(BM_WritePlainEXR)->Unit(benchmark::kMillisecond)->Iterations(3)->UseRealTime();

// The single-image writer on 1 and 2 library threads (the argument), at the size of the
// Cornell benchmark's picture: the output step of a camera render. A rendered picture is
// noisy in its low bits (sampled shadows), which ZIP compresses more slowly than a plain
// gradient, so the gradient gets a little noise.
constexpr int kSize = 512;

void BM_WriteEXR(benchmark::State &state) {
    static std::unique_ptr<ox::Frame> f = [] {
        auto fr = std::make_unique<ox::Frame>(kSize, kSize);
        std::vector<ox::Color> p(size_t(kSize) * kSize);
        ox::Random random(7);
        for (int y = 0; y < kSize; ++y)
            for (int x = 0; x < kSize; ++x) {
                const ox::Color c = picture()[size_t(y) * kImage + x];
                const float n = 0.002f * random.next();
                p[size_t(y) * kSize + x] = ox::Color(c.r + n, c.g + n, c.b + n, c.a);
            }
        fr->addTiledLayer<ox::Color>("beauty")->paste(ox::Region(0, 0, kSize, kSize), p.data());
        return fr;
    }();
    ox::setImageWriterThreads(int32_t(state.range(0)));
    const std::string name = outputName("single");
    for (auto _ : state)
        if (!ox::writeEXR(name, *f->getColorLayer("beauty"), true))
            state.SkipWithError("write failed");
    ox::setImageWriterThreads(1);
    std::remove(name.c_str());
    state.SetBytesProcessed(int64_t(state.iterations()) * kSize * kSize * 16);
}
BENCHMARK(BM_WriteEXR)->Arg(1)->Arg(2)->Unit(benchmark::kMillisecond)->UseRealTime();

}  // namespace

BENCHMARK_MAIN();
