// Temporary mesh files (.vtm): the header checks, then every vertex, UV and triangle record.
#include <cstdint>

#include "fuzz/fuzz_support.h"
#include "scene/vtm.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *data, size_t size) {
    static oxfuzz::ScratchFile file(".vtm");
    static const bool quiet = (oxfuzz::quietMessages(), true);
    (void)quiet;
    if (!file.write(data, size)) return 0;
    vtm::TempMesh mesh;
    std::string error;
    vtm::readTempMesh(file.path(), mesh, &error);
    return 0;
}
