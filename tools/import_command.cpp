#include "tools/import_command.h"

#include <sys/resource.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <charconv>
#include <cmath>
#include <cstdio>
#include <cstring>
#include <filesystem>

#include "core/message.h"
#include "platform/file_system.h"
#include "tools/model_checks.h"
#include "tools/scene_xml_writer.h"
#include "tools/shape_file.h"

namespace ox {

namespace {

namespace fs = std::filesystem;

bool parseFloat(const std::string &text, float &out) {
    const char *b = text.data(), *e = b + text.size();
    auto r = std::from_chars(b, e, out);
    return r.ec == std::errc() && r.ptr == e && std::isfinite(out);
}

bool parseInt(const std::string &text, int &out) {
    const char *b = text.data(), *e = b + text.size();
    auto r = std::from_chars(b, e, out);
    return r.ec == std::errc() && r.ptr == e;
}

// A size in MiB, or with the suffix M (MiB) or G (GiB).
bool parseMemorySize(const std::string &text, uint64_t &bytes) {
    std::string digits = text;
    unsigned shift = 20;
    if (!digits.empty() && (digits.back() == 'G' || digits.back() == 'g'))
        shift = 30, digits.pop_back();
    else if (!digits.empty() && (digits.back() == 'M' || digits.back() == 'm'))
        digits.pop_back();
    uint64_t value = 0;
    const char *b = digits.data(), *e = b + digits.size();
    auto r = std::from_chars(b, e, value);
    if (r.ec != std::errc() || r.ptr != e || digits.empty() || value > (uint64_t(1) << 40))
        return false;
    bytes = value << shift;
    return true;
}

std::string formatVec(const Vec3 &v) { return formatText("(%g, %g, %g)", v.x, v.y, v.z); }

}  // namespace

std::vector<std::string> importUsage() {
    return {
        "Usage: thevorn-import <model> -o <dir> [options]",
        "Reads a model file (OBJ, PLY, glTF 2.0, COLLADA, 3DS, FBX and the other formats of the",
        "Open Asset Import Library) and writes one .vtm mesh file per shape and one scene file.",
        "  -o, --output DIR       output directory (made when missing)",
        "  --list                 print what the model holds; write nothing",
        "  --scene NAME           scene file name in DIR (default: the model's name + .xml)",
        "  --scale F              scene units per model unit (0.01: centimetres to metres)",
        "  --up y|z|x             the model's up axis, turned onto +y (default y)",
        "  --left-handed          the model is left-handed: mirror z",
        "  --prefix TEXT          put TEXT before every shape, material, instance, camera and",
        "                         light name",
        "  --weld / --no-weld     join identical vertices (default on)",
        "  --smoothing-angle DEG  largest angle smoothed over when normals are made (default 60)",
        "  --lightmap-uv RES      add a light-map UV set, laid out for RES x RES texels, to shapes",
        "                         that have fewer than two UV sets",
        "  --lightmap-padding N   empty texels between charts (default 2)",
        "  --lightmap-angle DEG   largest normal deviation inside one chart (default 45)",
        "  --progress / --no-progress  progress line while reading (default: files over 32 MiB)",
        "  --max-memory SIZE      memory the import may use, in MiB or with a suffix M or G",
        "                         (default: three quarters of the machine's memory)",
        "  --force                replace existing output files",
        "  -q, --quiet            only warnings and errors",
        "  -h, --help             this text",
        "Exit status: 0 success, 1 unreadable model or failed write, 2 bad command line,",
        "3 output files exist (use --force).",
    };
}

bool parseImportCommand(const std::vector<std::string> &args, ImportCommand &command, bool &help) {
    help = false;
    ImportCommand c;
    for (size_t i = 0; i < args.size(); ++i) {
        const std::string &a = args[i];
        auto value = [&](std::string &out) {
            if (i + 1 >= args.size()) {
                message(kMsgError, 6, "Option %s needs a value", a.c_str());
                return false;
            }
            out = args[++i];
            return true;
        };
        std::string v;
        if (a == "-h" || a == "--help") {
            help = true;
            return true;
        } else if (a == "-o" || a == "--output") {
            if (!value(c.outputDir)) return false;
        } else if (a == "--scene") {
            if (!value(c.sceneName)) return false;
            if (c.sceneName.empty() || c.sceneName.find('/') != std::string::npos) {
                message(kMsgError, 6, "Scene name must be a plain file name");
                return false;
            }
        } else if (a == "--list") {
            c.list = true;
        } else if (a == "--scale") {
            if (!value(v)) return false;
            if (!parseFloat(v, c.options.unitScale) || !(c.options.unitScale > 0.0f)) {
                message(kMsgError, 6, "Scale must be a positive number, not %s", v.c_str());
                return false;
            }
        } else if (a == "--up") {
            if (!value(v)) return false;
            if (v == "y" || v == "Y")
                c.options.upAxis = UpAxis::kY;
            else if (v == "z" || v == "Z")
                c.options.upAxis = UpAxis::kZ;
            else if (v == "x" || v == "X")
                c.options.upAxis = UpAxis::kX;
            else {
                message(kMsgError, 6, "Up axis must be x, y or z, not %s", v.c_str());
                return false;
            }
        } else if (a == "--left-handed") {
            c.options.flipHandedness = true;
        } else if (a == "--prefix") {
            if (!value(v)) return false;
            c.options.namePrefix = sanitizeName(v, "");
        } else if (a == "--weld") {
            c.options.weld = true;
        } else if (a == "--no-weld") {
            c.options.weld = false;
        } else if (a == "--smoothing-angle") {
            if (!value(v)) return false;
            float deg;
            if (!parseFloat(v, deg) || deg < 0.0f || deg > 180.0f) {
                message(kMsgError, 6, "Smoothing angle must be 0 to 180 degrees, not %s",
                        v.c_str());
                return false;
            }
            c.options.smoothingAngleDegrees = deg;
        } else if (a == "--lightmap-uv") {
            if (!value(v)) return false;
            if (!parseInt(v, c.lightmapResolution) || c.lightmapResolution < 8 ||
                c.lightmapResolution > 65536) {
                message(kMsgError, 6, "Light-map resolution must be 8 to 65536, not %s", v.c_str());
                return false;
            }
        } else if (a == "--lightmap-padding") {
            if (!value(v)) return false;
            if (!parseInt(v, c.lightmap.padding) || c.lightmap.padding < 0 ||
                c.lightmap.padding > 64) {
                message(kMsgError, 6, "Light-map padding must be 0 to 64 texels, not %s",
                        v.c_str());
                return false;
            }
        } else if (a == "--lightmap-angle") {
            if (!value(v)) return false;
            if (!parseFloat(v, c.lightmap.maxChartAngleDegrees) ||
                c.lightmap.maxChartAngleDegrees < 0.0f || c.lightmap.maxChartAngleDegrees > 89.0f) {
                message(kMsgError, 6, "Light-map chart angle must be 0 to 89 degrees, not %s",
                        v.c_str());
                return false;
            }
        } else if (a == "--progress") {
            c.progressMode = 1;
        } else if (a == "--no-progress") {
            c.progressMode = -1;
        } else if (a == "--max-memory") {
            if (!value(v)) return false;
            if (!parseMemorySize(v, c.maxMemoryBytes) || c.maxMemoryBytes < kMinImportMemoryBytes) {
                message(kMsgError, 6,
                        "Memory limit must be at least 64 MiB (as 64, 512M or 4G), not %s",
                        v.c_str());
                return false;
            }
        } else if (a == "--force") {
            c.force = true;
        } else if (a == "-q" || a == "--quiet") {
            c.quiet = true;
        } else if (!a.empty() && a[0] == '-') {
            message(kMsgError, 6, "Unknown option %s", a.c_str());
            return false;
        } else if (c.model.empty()) {
            c.model = a;
        } else {
            message(kMsgError, 6, "Only one model file can be given (%s)", a.c_str());
            return false;
        }
    }
    if (c.model.empty()) {
        message(kMsgError, 6, "No model file given");
        return false;
    }
    if (!c.list && c.outputDir.empty()) {
        message(kMsgError, 6, "No output directory given (-o DIR)");
        return false;
    }
    if (c.lightmapResolution > 0 && c.lightmap.padding * 4 >= c.lightmapResolution) {
        message(kMsgError, 6, "Light-map padding %d is too large for resolution %d",
                c.lightmap.padding, c.lightmapResolution);
        return false;
    }
    c.lightmap.resolution = c.lightmapResolution;
    command = std::move(c);
    return true;
}

bool addLightmapUVs(ImportedModel &model, const LightmapOptions &options) {
    for (ImportedShape &shape : model.shapes) {
        if (shape.uvSets.size() >= 2) continue;
        std::vector<uint32_t> triangles;
        triangles.reserve(shape.triangleCount() * 3);
        for (const ImportedGroup &g : shape.groups)
            triangles.insert(triangles.end(), g.indices.begin(), g.indices.end());
        LightmapLayout layout;
        if (!generateLightmapLayout(shape.positions, triangles, options, layout)) {
            message(kMsgError, 6, "Light-map UVs for shape %s failed", shape.name.c_str());
            return false;
        }
        const bool hadNoUVs = shape.uvSets.empty();
        if (hadNoUVs) appendCornerUVSet(shape, "uv0", layout.cornerUVs);
        std::unordered_set<std::string> names(shape.uvSetNames.begin(), shape.uvSetNames.end());
        appendCornerUVSet(shape, uniqueName("lightmap", names), layout.cornerUVs);
        if (hadNoUVs) {
            // The tangent frames follow the new first set instead of an arbitrary direction.
            std::fill(shape.tangents.begin(), shape.tangents.end(), Vec3());
            completeTangentFrames(shape);
        }
        message(kMsgInfo, 6,
                "Light-map UVs for %s: %u charts, %.1f%% of the square covered, largest stretch "
                "%.3f, %.4g texels per unit",
                shape.name.c_str(), layout.chartCount, layout.coverage * 100.0,
                double(layout.largestStretch), double(layout.texelsPerUnit));
    }
    return true;
}

std::vector<std::string> describeModel(const ImportedModel &model) {
    std::vector<std::string> lines;
    BBox all;
    size_t triangles = 0;
    for (const ImportedShape &s : model.shapes) triangles += s.triangleCount();
    lines.push_back(formatText("Shapes: %zu (%zu triangles)", model.shapes.size(), triangles));
    for (const ImportedShape &s : model.shapes) {
        BBox b = s.bounds();
        std::string sets;
        for (const std::string &n : s.uvSetNames) sets += (sets.empty() ? "" : ", ") + n;
        lines.push_back(formatText("  %s: %zu vertices, %zu triangles, UV sets [%s]%s",
                                   s.name.c_str(), s.positions.size(), s.triangleCount(),
                                   sets.c_str(), s.hasColors() ? ", vertex colours" : ""));
        lines.push_back("    box " + formatVec(b.min) + " - " + formatVec(b.max));
        for (const ImportedGroup &g : s.groups)
            lines.push_back(formatText("    material %s: %zu triangles", g.material.c_str(),
                                       g.indices.size() / 3));
    }
    lines.push_back(formatText("Materials: %zu", model.materials.size()));
    for (const ImportedMaterial &m : model.materials) {
        std::string line = formatText("  %s: diffuse (%g, %g, %g)", m.name.c_str(),
                                      m.diffuse.color.r, m.diffuse.color.g, m.diffuse.color.b);
        const std::pair<const char *, const ImportedChannel *> channels[] = {
            {"diffuse", &m.diffuse},   {"ambient", &m.ambient},   {"transparency", &m.transparency},
            {"emissive", &m.emissive}, {"specular", &m.specular}, {"reflection", &m.reflection},
            {"normal", &m.normal}};
        for (const auto &[name, ch] : channels) {
            if (ch->embeddedImage >= 0 && size_t(ch->embeddedImage) < model.images.size())
                line += formatText(", %s map %s (stored in the model)", name,
                                   model.images[size_t(ch->embeddedImage)].fileName.c_str());
            if (!ch->fileTexture.empty())
                line += formatText(", %s map %s", name, ch->fileTexture.c_str());
            if (name != std::string("diffuse") && ch->fileTexture.empty() && ch->scale > 0.0f)
                line +=
                    formatText(", %s (%g, %g, %g)", name, ch->color.r, ch->color.g, ch->color.b);
        }
        if (m.diffuse.useVertexColor) line += ", vertex colours";
        lines.push_back(line);
    }
    lines.push_back(formatText("Instances: %zu", model.instances.size()));
    for (const ImportedInstance &in : model.instances) {
        const Mtx4 &m = in.objectToWorld;
        lines.push_back(formatText("  %s -> %s at (%g, %g, %g)", in.name.c_str(), in.shape.c_str(),
                                   m.m[3][0], m.m[3][1], m.m[3][2]));
        for (const ImportedShape &s : model.shapes)
            if (s.name == in.shape) {
                BBox b = s.bounds();
                for (int k = 0; k < 8 && !b.isEmpty(); ++k)
                    all.extend(
                        m.transformPoint(Vec3(k & 1 ? b.max.x : b.min.x, k & 2 ? b.max.y : b.min.y,
                                              k & 4 ? b.max.z : b.min.z)));
            }
    }
    lines.push_back(formatText("Cameras: %zu", model.cameras.size()));
    for (const ImportedCamera &c : model.cameras) {
        const Mtx4 &m = c.objectToWorld;
        lines.push_back(
            formatText("  %s: %s at (%g, %g, %g) looking along (%g, %g, %g)", c.name.c_str(),
                       c.type == ImportedCameraType::kOrtho ? "orthographic" : "perspective",
                       m.m[3][0], m.m[3][1], m.m[3][2], -m.m[2][0], -m.m[2][1], -m.m[2][2]));
    }
    static const char *kLightNames[] = {"point", "directional", "spot",
                                        "area",  "window",      "environment"};
    lines.push_back(formatText("Lights: %zu", model.lights.size()));
    for (const ImportedLight &l : model.lights) {
        const Mtx4 &m = l.objectToWorld;
        lines.push_back(formatText("  %s: %s, colour (%g, %g, %g) at (%g, %g, %g)", l.name.c_str(),
                                   kLightNames[int(l.type)], l.color.r, l.color.g, l.color.b,
                                   m.m[3][0], m.m[3][1], m.m[3][2]));
    }
    if (!all.isEmpty())
        lines.push_back("Scene box " + formatVec(all.min) + " - " + formatVec(all.max));
    return lines;
}

namespace {

void reportStats(const ImportStats &s) {
    if (s.badIndexFaces)
        message(kMsgWarning, 6, "Dropped %llu faces with vertex indices out of range",
                (unsigned long long)s.badIndexFaces);
    if (s.nonFiniteFaces)
        message(kMsgWarning, 6, "Dropped %llu faces with NaN or infinite positions",
                (unsigned long long)s.nonFiniteFaces);
    if (s.pointsAndLines)
        message(kMsgWarning, 6, "Dropped %llu points and lines",
                (unsigned long long)s.pointsAndLines);
    if (s.polygonsTriangulated)
        message(kMsgInfo, 6, "Triangulated %llu polygons of more than three corners",
                (unsigned long long)s.polygonsTriangulated);
    if (s.hugePolygons)
        message(kMsgWarning, 6, "Dropped %llu polygons of more than %u corners",
                (unsigned long long)s.hugePolygons, kMaxPolygonCorners);
    if (s.emptyMeshes)
        message(kMsgWarning, 6, "Skipped %llu meshes without triangles",
                (unsigned long long)s.emptyMeshes);
}

}  // namespace

static int runImportSteps(const ImportCommand &command, const std::function<void(float)> &progress);

uint64_t defaultImportMemoryLimit() {
    const long pages = ::sysconf(_SC_PHYS_PAGES), pageSize = ::sysconf(_SC_PAGE_SIZE);
    if (pages <= 0 || pageSize <= 0) return uint64_t(8) << 30;
    return std::max(uint64_t(pages) / 4 * 3 * uint64_t(pageSize), kMinImportMemoryBytes);
}

bool applyImportMemoryLimit(uint64_t bytes) {
#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
    (void)bytes;
    return true;
#else
#if defined(__has_feature)
#if __has_feature(address_sanitizer) || __has_feature(thread_sanitizer) || \
    __has_feature(memory_sanitizer)
    (void)bytes;
    return true;
#endif
#endif
    struct rlimit limit;
    if (::getrlimit(RLIMIT_AS, &limit) != 0) return false;
    if (limit.rlim_max != RLIM_INFINITY && rlim_t(bytes) > limit.rlim_max) bytes = limit.rlim_max;
    limit.rlim_cur = rlim_t(bytes);
    return ::setrlimit(RLIMIT_AS, &limit) == 0;
#endif
}

int runImport(const ImportCommand &command, const std::function<void(float)> &progress) {
    // Whatever allocation still fails under the memory limit ends the import cleanly.
    try {
        return runImportSteps(command, progress);
    } catch (const std::bad_alloc &) {
        message(kMsgError, 6, "Cannot import %s: out of memory", command.model.c_str());
    }
    return kImportFailed;
}

static int runImportSteps(const ImportCommand &command,
                          const std::function<void(float)> &progress) {
    if (command.quiet) setTypeEnabled(kMsgInfo | kMsgProgress, false);
    ImportOptions options = command.options;
    std::error_code ec;
    const auto size = fs::file_size(command.model, ec);
    if (progress && (command.progressMode > 0 ||
                     (command.progressMode == 0 && !ec && size >= kProgressFileBytes)))
        options.progress = progress;

    ImportedModel model;
    ImportStats stats;
    if (!readModel(command.model, options, model, stats)) return kImportFailed;
    if (options.progress) options.progress(1.0f);
    reportStats(stats);
    if (model.shapes.empty() && !command.list) {
        // Nothing a scene could show: refuse before any file or directory is made. A listing
        // writes nothing and still shows what the file holds.
        message(kMsgError, 6, "The model %s holds no triangles; nothing was written",
                command.model.c_str());
        return kImportFailed;
    }

    if (command.lightmapResolution > 0 && !addLightmapUVs(model, command.lightmap))
        return kImportFailed;

    if (command.list) {
        for (const std::string &line : describeModel(model)) consoleLine(line);
        return kImportOk;
    }

    // Every target is checked before anything is written, so a refusal leaves no partial set.
    const fs::path dir(command.outputDir);
    std::string sceneName = command.sceneName;
    if (sceneName.empty())
        sceneName = sanitizeName(fs::path(command.model).stem().string(), "scene") + ".xml";
    std::vector<std::pair<std::string, const ImportedShape *>> targets;
    for (const ImportedShape &s : model.shapes)
        targets.emplace_back((dir / (s.name + ".vtm")).string(), &s);
    const std::string scenePath = (dir / sceneName).string();
    const fs::path textureDir = dir / "textures";
    std::vector<std::string> imagePaths;
    for (const ImportedImage &image : model.images)
        imagePaths.push_back((textureDir / image.fileName).string());
    if (!command.force) {
        std::vector<std::string> all = imagePaths;
        for (const auto &[path, shape] : targets) all.push_back(path);
        all.push_back(scenePath);
        for (const std::string &path : all)
            if (fs::exists(path, ec)) {
                message(kMsgError, 6, "Refusing to overwrite %s (use --force)", path.c_str());
                return kImportWouldOverwrite;
            }
    }
    fs::create_directories(model.images.empty() ? dir : textureDir, ec);
    if (!fs::is_directory(dir, ec) ||
        (!model.images.empty() && !fs::is_directory(textureDir, ec))) {
        message(kMsgError, 6, "Cannot create output directory %s", command.outputDir.c_str());
        return kImportFailed;
    }
    for (const auto &[path, shape] : targets)
        if (!writeShapeFile(path, *shape)) return kImportFailed;
    // Images stored in the model become files; the materials name them by absolute path.
    for (size_t i = 0; i < model.images.size(); ++i)
        if (!writeFileAtomically(imagePaths[i], model.images[i].bytes)) {
            message(kMsgError, 6, "Cannot write texture %s: %s", imagePaths[i].c_str(),
                    std::strerror(errno));
            return kImportFailed;
        }
    for (ImportedMaterial &m : model.materials)
        for (ImportedChannel *ch : {&m.diffuse, &m.ambient, &m.transparency, &m.emissive,
                                    &m.specular, &m.reflection, &m.normal})
            if (ch->embeddedImage >= 0 && size_t(ch->embeddedImage) < imagePaths.size())
                ch->fileTexture = fs::absolute(imagePaths[size_t(ch->embeddedImage)], ec)
                                      .lexically_normal()
                                      .string();
    if (!writeSceneXml(scenePath, model)) return kImportFailed;
    size_t triangles = 0;
    for (const ImportedShape &s : model.shapes) triangles += s.triangleCount();
    message(kMsgInfo, 6,
            "Wrote %zu mesh files (%zu triangles) and %s with %zu materials, %zu instances, %zu "
            "cameras, %zu lights",
            targets.size(), triangles, scenePath.c_str(), model.materials.size(),
            model.instances.size(), model.cameras.size(), model.lights.size());
    if (model.lights.empty())
        message(kMsgInfo, 6,
                "The model has no lights; add one before baking (README, \"Adding lights\", has "
                "ready LightSource blocks)");
    return kImportOk;
}

}  // namespace ox
