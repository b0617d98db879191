// Input list files: the tree reader into the list of input file names.
#include <cstdint>
#include <string_view>

#include "config/input_list.h"
#include "config/xml.h"
#include "fuzz/fuzz_support.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *data, size_t size) {
    static const bool quiet = (oxfuzz::quietMessages(), true);
    (void)quiet;
    ox::InputSpecification list;
    if (ox::loadSettingsFromMemory(std::string_view(reinterpret_cast<const char *>(data), size),
                                   list))
        (void)list.filelist.values();
    return 0;
}
