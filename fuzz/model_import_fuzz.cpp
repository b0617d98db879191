// The model import from memory, through its own file layer: the first byte chooses the format
// (by the file name the reader is given) and a few options, the rest is the file. Text after a
// line "#side" is served as every side file the model names (material libraries, buffers).
#include <cstdint>
#include <string>
#include <string_view>

#include "fuzz/fuzz_support.h"
#include "tools/model_reader.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *data, size_t size) {
    static const bool quiet = (oxfuzz::quietMessages(), true);
    (void)quiet;
    static const char *const kNames[] = {"model.obj", "model.ply", "model.gltf", "model.glb"};
    if (size < 1) return 0;
    const uint8_t selector = data[0];
    std::string_view model(reinterpret_cast<const char *>(data) + 1, size - 1), side;
    const size_t marker = model.find("\n#side\n");
    if (marker != std::string_view::npos) {
        side = model.substr(marker + 7);
        model = model.substr(0, marker + 1);
    }
    ox::ImportOptions options;
    options.weld = (selector & 0x10) == 0;
    options.upAxis = (selector & 0x20) ? ox::UpAxis::kZ : ox::UpAxis::kY;
    options.flipHandedness = (selector & 0x40) != 0;
    ox::ImportedModel imported;
    ox::ImportStats stats;
    ox::readModelFromMemory(kNames[selector & 3], model, options, imported, stats,
                            [&](const std::string &, std::string &bytes) {
                                if (marker == std::string_view::npos) return false;
                                bytes.assign(side);
                                return true;
                            });
    return 0;
}
