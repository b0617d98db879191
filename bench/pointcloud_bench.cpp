// Writing and reading a point cloud of 10M points with position, normal and colour (360 MB of
// samples) in the binary encoding, beside writing and reading the same bytes with one fwrite /
// fread. The cloud writer syncs its temporary file before renaming it, so the baselines are
// timed both without and with an fsync. Files go to $TMPDIR (or /tmp).
#include <benchmark/benchmark.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <string>

#include "core/message.h"
#include "pointcloud/point_cloud_io.h"

namespace {

constexpr uint64_t kPoints = 10'000'000;

std::string tempPath(const char *name) {
    const char *dir = std::getenv("TMPDIR");
    return std::string(dir && *dir ? dir : "/tmp") + "/" + name + std::to_string(::getpid());
}

const ox::PointCloud &cloud() {
    static const ox::PointCloud c = [] {
        ox::PointCloud p;
        p.header().type = "colourPoint";
        p.header().typeId = 100;
        p.addVariable("position", ox::PointDataType::Float, 3);
        p.addVariable("normal", ox::PointDataType::Float, 3);
        p.addVariable("colour", ox::PointDataType::Float, 3);
        if (!p.resize(kPoints)) std::abort();
        float *f = reinterpret_cast<float *>(p.mutableBytes().data());
        for (uint64_t i = 0; i < kPoints * 9; ++i) f[i] = float(i % 1000) * 0.001f;
        p.updateBounds();
        return p;
    }();
    return c;
}

void quiet() { ox::setTypeEnabled(ox::kMsgInfo, false); }

void setBytes(benchmark::State &state) {
    state.SetBytesProcessed(int64_t(state.iterations()) * int64_t(cloud().bytes().size()));
}

void BM_PointCloudWrite(benchmark::State &state) {
    quiet();
    const std::string path = tempPath("oxbench_write.ptc");
    const ox::PointCloud &c = cloud();  // made before the timing starts
    for (auto _ : state)
        if (!ox::writePointCloud(path, c)) state.SkipWithError("write failed");
    setBytes(state);
    std::remove(path.c_str());
}

void BM_PointCloudRead(benchmark::State &state) {
    quiet();
    const std::string path = tempPath("oxbench_read.ptc");
    if (!ox::writePointCloud(path, cloud())) state.SkipWithError("write failed");
    for (auto _ : state) {
        ox::PointCloud back;
        if (!ox::readPointCloud(path, back)) state.SkipWithError("read failed");
        benchmark::DoNotOptimize(back.bytes().data());
    }
    setBytes(state);
    std::remove(path.c_str());
}

/// One fwrite of the sample bytes; with state.range(0), fsync before fclose.
void BM_FwriteBaseline(benchmark::State &state) {
    const std::string path = tempPath("oxbench_fwrite.bin");
    const auto &bytes = cloud().bytes();
    for (auto _ : state) {
        std::FILE *f = std::fopen(path.c_str(), "wb");
        if (!f || std::fwrite(bytes.data(), 1, bytes.size(), f) != bytes.size())
            state.SkipWithError("fwrite failed");
        if (f && state.range(0)) {
            std::fflush(f);
            ::fsync(fileno(f));
        }
        if (f) std::fclose(f);
    }
    setBytes(state);
    std::remove(path.c_str());
}

/// One fread of the same bytes into a fresh buffer.
void BM_FreadBaseline(benchmark::State &state) {
    const std::string path = tempPath("oxbench_fread.bin");
    const auto &bytes = cloud().bytes();
    std::FILE *out = std::fopen(path.c_str(), "wb");
    if (!out || std::fwrite(bytes.data(), 1, bytes.size(), out) != bytes.size())
        state.SkipWithError("fwrite failed");
    if (out) std::fclose(out);
    for (auto _ : state) {
        ox::PointBytes buffer(bytes.size());
        std::FILE *f = std::fopen(path.c_str(), "rb");
        if (!f || std::fread(buffer.data(), 1, buffer.size(), f) != buffer.size())
            state.SkipWithError("fread failed");
        if (f) std::fclose(f);
        benchmark::DoNotOptimize(buffer.data());
    }
    setBytes(state);
    std::remove(path.c_str());
}

BENCHMARK(BM_PointCloudWrite)->Unit(benchmark::kMillisecond)->UseRealTime()->Iterations(3);
BENCHMARK(BM_FwriteBaseline)
    ->Arg(0)
    ->Arg(1)
    ->Unit(benchmark::kMillisecond)
    ->UseRealTime()
    ->Iterations(3);
BENCHMARK(BM_PointCloudRead)->Unit(benchmark::kMillisecond)->UseRealTime()->Iterations(3);
BENCHMARK(BM_FreadBaseline)->Unit(benchmark::kMillisecond)->UseRealTime()->Iterations(3);

}  // namespace

BENCHMARK_MAIN();
