// libFuzzer target of the point-cloud readers. The first byte chooses the encoding (even:
// binary, odd: XML); the rest is the file. A cloud that reads must write and read back.
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <string>
#include <string_view>

#include "core/message.h"
#include "pointcloud/point_cloud_io.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *data, size_t size) {
    static const bool quiet = [] {
        ox::setTypeEnabled(0xFFFFFFFFu, false);
        return true;
    }();
    (void)quiet;
    if (size == 0) return 0;
    const ox::PointCloudEncoding encoding =
        (data[0] & 1) ? ox::PointCloudEncoding::Xml : ox::PointCloudEncoding::Binary;
    const std::string_view bytes(reinterpret_cast<const char *>(data + 1), size - 1);

    ox::PointCloud cloud;
    if (!ox::readPointCloudFromMemory(bytes, encoding, cloud)) return 0;
    // What was read must be writable in the binary encoding and read back the same way; the XML
    // encoding may refuse names it cannot carry, but what it writes must read back.
    for (ox::PointCloudEncoding e : {ox::PointCloudEncoding::Binary, ox::PointCloudEncoding::Xml}) {
        std::string out;
        if (!ox::writePointCloudToMemory(out, e, cloud)) continue;
        ox::PointCloud again;
        if (!ox::readPointCloudFromMemory(out, e, again)) std::abort();
        if (again.size() != cloud.size() || again.pointSize() != cloud.pointSize()) std::abort();
    }
    return 0;
}
