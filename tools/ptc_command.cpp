#include "tools/ptc_command.h"

#include <algorithm>
#include <charconv>
#include <optional>

#include "core/message.h"
#include "pointcloud/point_cloud_io.h"

namespace ox {

const char *const kPtcUsageText =
    "Usage: thevorn-ptc info <file> [--points N]\n"
    "       thevorn-ptc convert <in> <out>\n"
    "  info     prints the header (kind, type id, point count, point size, bounding box,\n"
    "           matrix), the variables and the first N samples (default 5).\n"
    "  convert  reads a point cloud and writes it in the encoding the output name chooses:\n"
    "           a name ending in \".xml\" gets the XML encoding, any other the binary one.\n"
    "Exit status: 0 success, 1 a file could not be read or written, 2 bad command line.\n";

bool parsePtcCommand(const std::vector<std::string> &args, PtcCommand &command,
                     std::string &error) {
    command = PtcCommand();
    if (args.empty()) {
        error = "No command given";
        return false;
    }
    const std::string &verb = args[0];
    if (verb == "-h" || verb == "--help" || verb == "help") {
        command.action = PtcCommand::Action::Help;
        return args.size() == 1 || (error = "help takes no arguments", false);
    }
    std::vector<std::string> files;
    bool pointsGiven = false;
    for (size_t i = 1; i < args.size(); ++i) {
        const std::string &a = args[i];
        if (a == "--points" && verb == "info") {
            if (pointsGiven) {
                error = "--points given twice";
                return false;
            }
            if (i + 1 >= args.size()) {
                error = "--points needs a number";
                return false;
            }
            const std::string &n = args[++i];
            auto r = std::from_chars(n.data(), n.data() + n.size(), command.samples);
            if (n.empty() || r.ec != std::errc() || r.ptr != n.data() + n.size()) {
                error = "--points needs a number, not \"" + n + "\"";
                return false;
            }
            pointsGiven = true;
        } else if (a.size() > 1 && a[0] == '-') {
            error = "Unknown option " + a;
            return false;
        } else {
            files.push_back(a);
        }
    }
    if (verb == "info") {
        if (files.size() != 1) {
            error = "info needs exactly one file";
            return false;
        }
        command.action = PtcCommand::Action::Info;
        command.input = files[0];
        return true;
    }
    if (verb == "convert") {
        if (files.size() != 2) {
            error = "convert needs an input and an output file";
            return false;
        }
        command.action = PtcCommand::Action::Convert;
        command.input = files[0];
        command.output = files[1];
        return true;
    }
    error = "Unknown command " + verb;
    return false;
}

namespace {

std::string floatText(float v) {
    std::string s;
    appendPointValueText(reinterpret_cast<const uint8_t *>(&v), PointDataType::Float, s);
    return s;
}

std::string vecText(const Vec3 &v) {
    return "(" + floatText(v.x) + ", " + floatText(v.y) + ", " + floatText(v.z) + ")";
}

}  // namespace

std::string pointCloudSummary(const PointCloud &cloud, uint64_t samples) {
    const PointCloudHeader &h = cloud.header();
    std::string s;
    std::optional<PointKind> kind = pointKindFromId(h.typeId);
    s += "Kind: " + h.type;
    if (!kind)
        s += " (type id " + std::to_string(h.typeId) + ", not a known kind)\n";
    else if (h.type != pointKindName(*kind))
        s += " (type id " + std::to_string(h.typeId) + ", which is " + pointKindName(*kind) + ")\n";
    else
        s += " (type id " + std::to_string(h.typeId) + ")\n";
    if (!h.description.empty()) s += "Description: " + h.description + "\n";
    s += formatText("Version: %u\nCompression: %u\n", h.version, h.compression);
    s += formatText("Points: %llu\nPoint size: %llu bytes\n", (unsigned long long)cloud.size(),
                    (unsigned long long)cloud.pointSize());
    s += "Bounding box: " + vecText(h.boundsMin) + " - " + vecText(h.boundsMax) + "\n";
    s += "Object to world:\n";
    for (int r = 0; r < 4; ++r) {
        s += " ";
        for (int c = 0; c < 4; ++c) s += " " + floatText(h.objectToWorld.m[r][c]);
        s += "\n";
    }
    s += formatText("Variables: %zu\n", cloud.variables().size());
    for (const PointVariable &v : cloud.variables())
        s += formatText("  %s: %s x %u (offset %u)\n", v.name.c_str(), pointDataTypeName(v.type),
                        v.count, v.offset);
    const uint64_t shown = std::min<uint64_t>(samples, cloud.size());
    if (shown == 0) return s;
    s += formatText("Samples (first %llu of %llu):\n", (unsigned long long)shown,
                    (unsigned long long)cloud.size());
    for (uint64_t i = 0; i < shown; ++i) {
        s += formatText("  %llu:", (unsigned long long)i);
        const uint8_t *p = cloud.point(i);
        for (const PointVariable &v : cloud.variables()) {
            s += " " + v.name + " ";
            if (v.count != 1) s += "(";
            for (uint32_t e = 0; e < v.count; ++e) {
                if (e) s += ", ";
                appendPointValueText(p + v.offset + uint64_t(e) * v.elementSize(), v.type, s);
            }
            if (v.count != 1) s += ")";
        }
        s += "\n";
    }
    return s;
}

int runPtc(const PtcCommand &command, std::string &out) {
    out.clear();
    PointCloud cloud;
    if (command.action == PtcCommand::Action::Info) {
        // The summary is the output: the reading notice would only be in its way.
        setTypeEnabled(kMsgInfo, false);
        if (!readPointCloud(command.input, cloud)) return kPtcFailed;
        out = "File: " + command.input +
              (pointCloudEncodingOf(command.input) == PointCloudEncoding::Xml ? " (XML)\n"
                                                                              : " (binary)\n");
        out += pointCloudSummary(cloud, command.samples);
        return kPtcOk;
    }
    if (command.action == PtcCommand::Action::Convert) {
        if (!readPointCloud(command.input, cloud)) return kPtcFailed;
        if (!writePointCloud(command.output, cloud)) return kPtcFailed;
        return kPtcOk;
    }
    return kPtcOk;
}

}  // namespace ox
