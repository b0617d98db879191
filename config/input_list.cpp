#include "config/input_list.h"

#include "config/xml.h"

namespace ox {

bool loadInputList(const std::string &file, std::vector<std::string> &out) {
    InputSpecification list;
    if (!loadSettings(file, list)) return false;
    std::vector<std::string> entries = list.filelist.values();
    out.insert(out.end(), entries.begin(), entries.end());
    return true;
}

}  // namespace ox
