#include "config/input_list.h"

#include "config/xml.h"
#include "core/message.h"

namespace ox {

bool expandInputLists(const std::vector<std::string> &listFiles, std::vector<std::string> &out) {
    std::vector<std::string> added;
    for (const std::string &file : listFiles) {
        InputSpecification spec;
        if (!loadSettings(file, spec)) {
            messageText(kMsgError, 1, "Unable to load input file list from file: " + file);
            return false;
        }
        for (size_t i = 0; i < spec.filelist.size(); ++i) added.push_back(spec.filelist[i]);
    }
    out.insert(out.end(), added.begin(), added.end());
    return true;
}

}  // namespace ox
