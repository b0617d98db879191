// Scene documents: the streaming reader into the compact scene records.
#include <cstdint>
#include <memory>
#include <string_view>
#include <vector>

#include "fuzz/fuzz_support.h"
#include "scene/scene_elements.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *data, size_t size) {
    static const bool quiet = (oxfuzz::quietMessages(), true);
    (void)quiet;
    std::vector<std::unique_ptr<SceneCompactBase>> records;
    std::string error;
    readSceneDocument(std::string_view(reinterpret_cast<const char *>(data), size), records, error);
    return 0;
}
