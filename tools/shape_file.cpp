#include "tools/shape_file.h"

#include "core/message.h"

namespace ox {

bool writeShapeFile(const std::string &path, const ImportedShape &shape) {
    message(kMsgError, 6, "Cannot write %s: mesh files are not available yet", path.c_str());
    return false;
}

}  // namespace ox
