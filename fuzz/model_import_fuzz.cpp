// The model import from memory, through its own file layer: the first byte chooses the format
// (by the file name the reader is given), the rest is the file.
#include <cstdint>
#include <string_view>

#include "fuzz/fuzz_support.h"
#include "tools/model_reader.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *data, size_t size) {
    static const bool quiet = (oxfuzz::quietMessages(), true);
    (void)quiet;
    static const char *const kNames[] = {"model.obj", "model.ply", "model.gltf", "model.glb"};
    if (size < 1) return 0;
    const uint8_t selector = data[0];
    ox::ImportOptions options;
    options.weld = (selector & 0x10) == 0;
    options.upAxis = (selector & 0x20) ? ox::UpAxis::kZ : ox::UpAxis::kY;
    options.flipHandedness = (selector & 0x40) != 0;
    ox::ImportedModel model;
    ox::ImportStats stats;
    ox::readModelFromMemory(kNames[selector & 3],
                            std::string_view(reinterpret_cast<const char *>(data) + 1, size - 1),
                            options, model, stats);
    return 0;
}
