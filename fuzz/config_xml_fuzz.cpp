// The configuration file: the tree reader with XInclude into the whole settings tree.
#include <cstdint>
#include <string_view>

#include "config/ox_config.h"
#include "config/xml.h"
#include "fuzz/fuzz_support.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *data, size_t size) {
    static const bool quiet = (oxfuzz::quietMessages(), true);
    (void)quiet;
    ox::OXConfig config;
    ox::loadSettingsFromMemory(std::string_view(reinterpret_cast<const char *>(data), size),
                               config);
    return 0;
}
