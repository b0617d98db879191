// Texture lookups per second (bilinear, trilinear, EWA, anisotropic) on a 2048 x 2048 texture
// with random footprints, and loading a 4096 x 4096 PNG and EXR through the texture manager
// (read, decode, mip chain) beside the libraries' own bare decode of the same files.

#include <ImfArray.h>
#include <ImfChannelList.h>
#include <ImfFrameBuffer.h>
#include <ImfHeader.h>
#include <ImfInputFile.h>
#include <ImfOutputFile.h>
#include <benchmark/benchmark.h>
#include <png.h>
#include <unistd.h>

#include <cmath>
#include <cstdio>
#include <filesystem>
#include <vector>

#include "core/message.h"
#include "core/random.h"
#include "texture/texture.h"
#include "texture/texture_factory.h"

namespace {

constexpr int kLookupSize = 2048;
constexpr int kLoadSize = 4096;

/// A picture with detail at every scale: a few octaves of sine patterns.
uint8_t pattern(int x, int y, int c) {
    const double v = 0.5 + 0.2 * std::sin(x * 0.013 + c) * std::cos(y * 0.021) +
                     0.15 * std::sin((x + y) * 0.17 + c * 2.0) + 0.1 * std::sin(x * y * 1e-4);
    return uint8_t(std::clamp(v, 0.0, 1.0) * 255.0);
}

std::shared_ptr<ox::MipImage> lookupImage() {
    static std::shared_ptr<ox::MipImage> image = [] {
        ox::TexelBuffer b;
        b.allocate("bench", kLookupSize, kLookupSize, {ox::TexelType::kU8, 4});
        for (int y = 0; y < kLookupSize; ++y)
            for (int x = 0; x < kLookupSize; ++x)
                for (int c = 0; c < 4; ++c) b.row(y)[x * 4 + c] = pattern(x, y, c);
        auto img = std::make_shared<ox::MipImage>();
        img->build("bench", std::move(b), false, 8);
        return img;
    }();
    return image;
}

/// Random lookups: positions uniform, footprints from 1/4 to 64 texels, any orientation,
/// anisotropy up to 8.
const std::vector<ox::TextureLookup> &lookups() {
    static const std::vector<ox::TextureLookup> all = [] {
        ox::Random rng(12345);
        std::vector<ox::TextureLookup> v(1 << 14);
        for (auto &l : v) {
            const float width = std::exp2(-2.0f + 8.0f * rng.next()) / kLookupSize;
            const float aniso = 1.0f + 7.0f * rng.next();
            const float angle = 6.2831853f * rng.next();
            const float c = std::cos(angle), s = std::sin(angle);
            l = {rng.next(),        rng.next(), c * width * aniso,
                 s * width * aniso, -s * width, c * width};
        }
        return v;
    }();
    return all;
}

template <typename Texture>
void lookupBench(benchmark::State &state) {
    Texture tex(lookupImage());
    const auto &ls = lookups();
    size_t i = 0;
    for (auto _ : state) {
        benchmark::DoNotOptimize(tex.filter(ls[i]));
        i = (i + 1) & (ls.size() - 1);
    }
    state.SetItemsProcessed(int64_t(state.iterations()));
}

void BM_LookupBilinear(benchmark::State &s) { lookupBench<ox::SimpleTexture>(s); }
void BM_LookupTrilinear(benchmark::State &s) { lookupBench<ox::MipMapTexture>(s); }
void BM_LookupEWA(benchmark::State &s) { lookupBench<ox::EWATexture>(s); }
void BM_LookupAniso(benchmark::State &s) { lookupBench<ox::AnisoTexture>(s); }
BENCHMARK(BM_LookupBilinear);
BENCHMARK(BM_LookupTrilinear);
BENCHMARK(BM_LookupEWA);
BENCHMARK(BM_LookupAniso);

// --- Loading ----------------------------------------------------------------------------------

std::string benchDir() {
    static const std::string dir = [] {
        auto d = std::filesystem::temp_directory_path() /
                 ("ox_texture_bench_" + std::to_string(::getpid()));
        std::filesystem::create_directories(d);
        return d.string();
    }();
    return dir;
}

const std::string &pngFile() {
    static const std::string file = [] {
        const std::string f = benchDir() + "/big.png";
        png_image img{};
        img.version = PNG_IMAGE_VERSION;
        img.width = img.height = kLoadSize;
        img.format = PNG_FORMAT_RGBA;
        std::vector<uint8_t> px(size_t(kLoadSize) * kLoadSize * 4);
        for (int y = 0; y < kLoadSize; ++y)
            for (int x = 0; x < kLoadSize; ++x)
                for (int c = 0; c < 4; ++c)
                    px[(size_t(y) * kLoadSize + x) * 4 + c] = pattern(x, y, c);
        png_image_write_to_file(&img, f.c_str(), 0, px.data(), 0, nullptr);
        return f;
    }();
    return file;
}

const std::string &exrFile() {
    static const std::string file = [] {
        const std::string f = benchDir() + "/big.exr";
        std::vector<Imath::half> px(size_t(kLoadSize) * kLoadSize * 4);
        for (int y = 0; y < kLoadSize; ++y)
            for (int x = 0; x < kLoadSize; ++x)
                for (int c = 0; c < 4; ++c)
                    px[(size_t(y) * kLoadSize + x) * 4 + c] = Imath::half(pattern(x, y, c) / 64.0f);
        Imf::Header h(kLoadSize, kLoadSize);
        h.compression() = Imf::ZIP_COMPRESSION;
        const char *names[4] = {"R", "G", "B", "A"};
        Imf::FrameBuffer fb;
        for (int c = 0; c < 4; ++c) {
            h.channels().insert(names[c], Imf::Channel(Imf::HALF));
            fb.insert(names[c], Imf::Slice(Imf::HALF, reinterpret_cast<char *>(&px[size_t(c)]), 8,
                                           8 * size_t(kLoadSize)));
        }
        Imf::OutputFile out(f.c_str(), h);
        out.setFrameBuffer(fb);
        out.writePixels(kLoadSize);
        return f;
    }();
    return file;
}

void loadBench(benchmark::State &state, const std::string &file) {
    ox::setTypeEnabled(ox::kMsgDebug | ox::kMsgVerbose, false);
    for (auto _ : state) {
        ox::TextureFactory factory;
        auto tex = factory.getTexture(file, ox::kFilterMipMap);
        if (!tex) state.SkipWithError("load failed");
        benchmark::DoNotOptimize(tex.get());
    }
}

void BM_LoadPNGWithMips(benchmark::State &s) { loadBench(s, pngFile()); }
void BM_LoadEXRWithMips(benchmark::State &s) { loadBench(s, exrFile()); }

void BM_LibpngDecodeOnly(benchmark::State &state) {
    const std::string &f = pngFile();
    for (auto _ : state) {
        // A load has to make its destination too: allocated (not zeroed) in every round.
        std::unique_ptr<uint8_t[]> px(new uint8_t[size_t(kLoadSize) * kLoadSize * 4]);
        png_image img{};
        img.version = PNG_IMAGE_VERSION;
        png_image_begin_read_from_file(&img, f.c_str());
        img.format = PNG_FORMAT_RGBA;
        png_image_finish_read(&img, nullptr, px.get(), 0, nullptr);
        benchmark::DoNotOptimize(px.get());
    }
}

void BM_OpenEXRDecodeOnly(benchmark::State &state) {
    const std::string &f = exrFile();
    for (auto _ : state) {
        std::unique_ptr<Imath::half[]> px(new Imath::half[size_t(kLoadSize) * kLoadSize * 4]);
        Imf::InputFile in(f.c_str());
        Imf::FrameBuffer fb;
        const char *names[4] = {"R", "G", "B", "A"};
        for (int c = 0; c < 4; ++c)
            fb.insert(names[c], Imf::Slice(Imf::HALF, reinterpret_cast<char *>(&px[size_t(c)]), 8,
                                           8 * size_t(kLoadSize)));
        in.setFrameBuffer(fb);
        in.readPixels(0, kLoadSize - 1);
        benchmark::DoNotOptimize(px.get());
    }
}

BENCHMARK(BM_LibpngDecodeOnly)->Unit(benchmark::kMillisecond)->Iterations(4);
BENCHMARK(BM_LoadPNGWithMips)->Unit(benchmark::kMillisecond)->Iterations(4);
BENCHMARK(BM_OpenEXRDecodeOnly)->Unit(benchmark::kMillisecond)->Iterations(4);
BENCHMARK(BM_LoadEXRWithMips)->Unit(benchmark::kMillisecond)->Iterations(4);

}  // namespace

int main(int argc, char **argv) {
    benchmark::Initialize(&argc, argv);
    benchmark::RunSpecifiedBenchmarks();
    benchmark::Shutdown();
    std::error_code ec;
    std::filesystem::remove_all(benchDir(), ec);
    return 0;
}
