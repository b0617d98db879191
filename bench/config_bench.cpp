// Reading settings documents: a 50 MB configuration through the tree reader, a 50 MB scene-like
// document through the streaming reader, and writing the configuration. Reported as bytes/s.
#include <benchmark/benchmark.h>
#include <unistd.h>

#include <cstdio>
#include <filesystem>
#include <string>

#include "config/type.h"
#include "config/xml.h"

namespace {

namespace fs = std::filesystem;

enum class BenchMode : int32_t { Off, Low, High };
OX_ENUM_NAMES(BenchMode, "BenchMode", "Off", "Low", "High");

class StatsBase : public ox::OXCComplexType {
public:
    StatsBase() : OXCComplexType("RenderStats") {}
    ox::OXCType<bool> primaryVisibility{this, "PrimaryVisibility", true, "Visible to the camera"};
    ox::OXCType<bool> castShadows{this, "CastShadows", true, "Casts shadows"};
    ox::OXCType<bool> receiveShadows{this, "ReceiveShadows", true, "Receives shadows"};
    ox::OXCType<bool> castGI{this, "CastGI", true, "Casts GI"};
};

class EntryBase : public ox::OXCComplexType {
public:
    EntryBase() : OXCComplexType("Entry") {}
    ox::OXCType<std::string> name{this, "Name", "", "Entry name"};
    ox::OXCType<std::string> shape{this, "Shape", "", "Shape name"};
    ox::OXCType<ox::Mtx4> objectToWorld{this, "ObjectToWorld", ox::Mtx4::identity(), "Placement"};
    ox::OXCEnum<BenchMode> mode{this, "Mode", BenchMode::Low, "Mode"};
    ox::OXCType<float> scale{this, "Scale", 1.0f, "Scale"};
    ox::OXCType<uint32_t> samples{this, "Samples", 16u, "Samples"};
    ox::OXCType<ox::Color> color{this, "Color", {0.5f, 0.25f, 0.125f, 1.0f}, "Colour"};
    ox::OXCTypedVector<std::string> links{this, "Links", "Linked names"};
    ox::OXCNested<StatsBase> stats{this, "", "Flags"};
};
using Entry = ox::OXCComplexTypeInstantiator<EntryBase>;

class BenchConfigBase : public ox::OXCComplexType {
public:
    BenchConfigBase() : OXCComplexType("OXConfig") {}
    ox::OXCTypedComplexVector<EntryBase> entries{this, "entries", "Entries"};
};
using BenchConfig = ox::OXCComplexTypeInstantiator<BenchConfigBase>;

void fillEntry(EntryBase &e, int i) {
    e.name = "entry" + std::to_string(i);
    e.shape = "shape" + std::to_string(i % 97);
    e.objectToWorld.ref().m[3][0] = float(i) * 0.37f;
    e.objectToWorld.ref().m[3][2] = float(i) / 7.0f;
    e.mode = BenchMode(i % 3);
    e.scale = 1.0f + float(i % 13) * 0.1f;
    e.links.push("light" + std::to_string(i % 5));
    e.links.push("light" + std::to_string(i % 7));
}

std::string benchPath(const char *kind, int64_t mb) {
    return (fs::temp_directory_path() /
            ("ox_" + std::string(kind) + "_bench_" + std::to_string(::getpid()) + "_" +
             std::to_string(mb) + ".xml"))
        .string();
}

/// The written configuration file of about `mb` MiB (made once per size).
std::string configFile(int64_t mb) {
    std::string p = benchPath("config", mb);
    if (fs::exists(p)) return p;
    const size_t kTargetBytes = size_t(mb) << 20;
    {
        BenchConfig c;
        std::string probe;
        fillEntry(c.entries.append(), 0);
        ox::writeSettingsToString(probe, c);
        size_t count = kTargetBytes / probe.size();
        for (size_t i = 1; i < count; ++i) fillEntry(c.entries.append(), int(i));
        ox::writeSettings(p, c);
    }
    return p;
}

/// The scene-like document of about `mb` MiB: the same entries under "OXScene".
std::string sceneFile(int64_t mb) {
    std::string p = benchPath("scene", mb);
    if (fs::exists(p)) return p;
    const size_t kTargetBytes = size_t(mb) << 20;
    {
        std::string text = "<?xml version=\"1.0\"?>\n<OXScene>\n";
        std::string one;
        for (int i = 0; text.size() < kTargetBytes; ++i) {
            Entry e;
            fillEntry(e, i);
            ox::writeSettingsToString(one, e, nullptr);
            text.append(one, one.find("<Entry>"));  // drop the declaration
        }
        text += "</OXScene>\n";
        FILE *f = std::fopen(p.c_str(), "wb");
        if (f) {
            std::fwrite(text.data(), 1, text.size(), f);
            std::fclose(f);
        }
    }
    return p;
}

void BM_LoadConfiguration(benchmark::State &state) {
    const std::string file = configFile(state.range(0));
    const auto bytes = int64_t(fs::file_size(file));
    size_t entries = 0;
    for (auto _ : state) {
        BenchConfig c;
        if (!ox::loadSettings(file, c)) state.SkipWithError("load failed");
        entries = c.entries.size();
        benchmark::DoNotOptimize(entries);
    }
    state.SetBytesProcessed(bytes * int64_t(state.iterations()));
    state.counters["entries"] = double(entries);
    state.counters["MB"] = double(bytes) / 1e6;
}
BENCHMARK(BM_LoadConfiguration)->Arg(5)->Arg(50)->Unit(benchmark::kMillisecond)->Iterations(3);

void BM_WriteConfiguration(benchmark::State &state) {
    const std::string file = configFile(state.range(0));
    const auto bytes = int64_t(fs::file_size(file));
    BenchConfig c;
    ox::loadSettings(file, c);
    std::string out = file + ".out";
    for (auto _ : state)
        if (!ox::writeSettings(out, c)) state.SkipWithError("write failed");
    std::remove(out.c_str());
    state.SetBytesProcessed(bytes * int64_t(state.iterations()));
}
BENCHMARK(BM_WriteConfiguration)->Arg(5)->Arg(50)->Unit(benchmark::kMillisecond)->Iterations(3);

void BM_StreamScene(benchmark::State &state) {
    const std::string file = sceneFile(state.range(0));
    const auto bytes = int64_t(fs::file_size(file));
    size_t objects = 0;
    double checksum = 0;
    ox::XMLSAXDeserializer sax;
    sax.addFactory<EntryBase>("Entry", [&](EntryBase &e) {
        ++objects;
        checksum += e.objectToWorld.get().m[3][0] + double(e.links.size());
        return true;
    });
    for (auto _ : state) {
        objects = 0;
        if (!sax.parseFile(file)) state.SkipWithError("parse failed");
    }
    benchmark::DoNotOptimize(checksum);
    state.SetBytesProcessed(bytes * int64_t(state.iterations()));
    state.counters["objects"] = double(objects);
    state.counters["MB"] = double(bytes) / 1e6;
}
BENCHMARK(BM_StreamScene)->Arg(5)->Arg(50)->Unit(benchmark::kMillisecond)->Iterations(3);

/// Removes the generated files when the program ends.
struct Cleanup {
    ~Cleanup() {
        std::error_code ec;
        for (int64_t mb : {5, 50}) {
            fs::remove(benchPath("config", mb), ec);
            fs::remove(benchPath("scene", mb), ec);
        }
    }
} gCleanup;

}  // namespace

BENCHMARK_MAIN();
