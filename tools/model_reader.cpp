#include "tools/model_reader.h"

#include <assimp/MemoryIOWrapper.h>
#include <assimp/config.h>
#include <assimp/postprocess.h>
#include <assimp/scene.h>
#include <sys/stat.h>

#include <algorithm>
#include <assimp/IOSystem.hpp>
#include <assimp/Importer.hpp>
#include <assimp/ProgressHandler.hpp>
#include <cerrno>
#include <cmath>
#include <cstdio>
#include <cstring>
#include <filesystem>
#include <map>
#include <new>
#include <numbers>
#include <string_view>
#include <unordered_map>
#include <unordered_set>

#include "core/message.h"
#include "tools/model_checks.h"

namespace ox {

namespace {

namespace fs = std::filesystem;

std::string lowerExtension(const std::string &path) {
    std::string ext = fs::path(path).extension().string();
    for (char &c : ext) c = char(std::tolower(static_cast<unsigned char>(c)));
    return ext;
}

// ---------------------------------------------------------------------------------------------
// OBJ face filter. The OBJ reader of the library refuses a whole file for one face that names a
// vertex that does not exist (or that carries a comment); such faces are taken out (and such
// comments cut off) before the text is read.

// Parses one corner of a face ("3", "-1", "3/2/1": the position part and, when present,
// the texture and normal parts). Returns false when any part is out of range.
bool objCornerInRange(std::string_view corner, const uint64_t counts[3]) {
    for (int part = 0; part < 3 && !corner.empty(); ++part) {
        size_t slash = corner.find('/');
        std::string_view field = corner.substr(0, slash);
        if (!field.empty()) {
            bool negative = field[0] == '-';
            if (negative || field[0] == '+') field.remove_prefix(1);
            uint64_t value = 0;
            if (field.empty()) return false;
            for (char c : field) {
                if (c < '0' || c > '9') return false;
                value = value * 10 + uint64_t(c - '0');
                if (value > (uint64_t(1) << 40)) return false;
            }
            if (value == 0 || value > counts[part]) return false;
        }
        if (slash == std::string_view::npos) break;
        corner.remove_prefix(slash + 1);
    }
    return true;
}

// Takes out faces with corners out of range (counted in dropped) and comments after face
// corners, which the library's reader refuses too. Returns true when the text changed; filtered
// then holds the new text.
bool filterObjFaces(const std::string &text, std::string &filtered, uint64_t &dropped) {
    // Indices may refer to vertices defined later in the file, so the totals count.
    uint64_t totals[3] = {0, 0, 0};
    auto forEachLine = [&](auto &&fn) {
        size_t pos = 0;
        while (pos < text.size()) {
            size_t end = text.find('\n', pos);
            if (end == std::string::npos) end = text.size();
            fn(std::string_view(text).substr(pos, end - pos), pos);
            pos = end + 1;
        }
    };
    auto keyword = [](std::string_view line) {
        size_t a = line.find_first_not_of(" \t");
        if (a == std::string_view::npos) return std::string_view();
        size_t b = line.find_first_of(" \t\r", a);
        return line.substr(a, b == std::string_view::npos ? line.size() - a : b - a);
    };
    forEachLine([&](std::string_view line, size_t) {
        std::string_view k = keyword(line);
        if (k == "v")
            ++totals[0];
        else if (k == "vt")
            ++totals[1];
        else if (k == "vn")
            ++totals[2];
    });
    dropped = 0;
    uint64_t seen[3] = {0, 0, 0};
    std::vector<std::pair<size_t, size_t>> cut;  // byte ranges to take out
    forEachLine([&](std::string_view line, size_t begin) {
        std::string_view k = keyword(line);
        if (k == "v")
            ++seen[0];
        else if (k == "vt")
            ++seen[1];
        else if (k == "vn")
            ++seen[2];
        if (k != "f" && k != "l" && k != "p") return;
        const size_t restAt = line.find(k) + k.size();
        std::string_view rest = line.substr(restAt);
        const size_t comment = rest.find('#');
        rest = rest.substr(0, comment);
        bool ok = true;
        size_t pos = 0;
        while (ok) {
            pos = rest.find_first_not_of(" \t\r", pos);
            if (pos == std::string_view::npos) break;
            size_t stop = rest.find_first_of(" \t\r", pos);
            std::string_view corner = rest.substr(
                pos, stop == std::string_view::npos ? std::string_view::npos : stop - pos);
            // Relative indices count back from the vertices defined so far.
            uint64_t limit[3] = {totals[0], totals[1], totals[2]};
            if (corner.find('-') != std::string_view::npos)
                limit[0] = seen[0], limit[1] = seen[1], limit[2] = seen[2];
            ok = objCornerInRange(corner, limit);
            if (stop == std::string_view::npos) break;
            pos = stop;
        }
        // The line break stays, so line numbers in later messages stay right.
        if (!ok) {
            ++dropped;
            cut.emplace_back(begin, begin + line.size());
        } else if (comment != std::string_view::npos) {
            cut.emplace_back(begin + restAt + comment, begin + line.size());
        }
    });
    if (cut.empty()) return false;
    filtered.clear();
    filtered.reserve(text.size());
    size_t from = 0;
    for (auto [b, e] : cut) {
        filtered.append(text, from, b - from);
        from = e;
    }
    filtered.append(text, from, std::string::npos);
    return true;
}

// Material libraries of OBJ files: statements before the first material of the library are
// taken out; the library's reader applies them to a material that does not exist and crashes.
// A sound library has nothing but comments there.
std::string mtlFromFirstMaterial(std::string text) {
    size_t pos = 0;
    while (pos < text.size()) {
        const size_t end = std::min(text.find('\n', pos), text.size());
        std::string_view line = std::string_view(text).substr(pos, end - pos);
        const size_t a = line.find_first_not_of(" \t\r");
        if (a != std::string_view::npos) {
            line.remove_prefix(a);
            if (line.substr(0, 6) == "newmtl" && line.size() > 7 &&
                (line[6] == ' ' || line[6] == '\t') &&
                line.find_first_not_of(" \t\r", 7) != std::string_view::npos)
                break;
        }
        pos = end + 1;
    }
    // Line breaks stay, so that line numbers in the library's messages stay right.
    for (size_t k = 0; k < std::min(pos, text.size()); ++k)
        if (text[k] != '\n') text[k] = ' ';
    return text;
}

// The model's own file layer: the model is served from memory, and every side file the library
// asks for (materials, buffers, images) is read through readModelFile, so that pipes, devices
// and oversized files are refused; without disk access side files come from the given reader.
class ModelFileSystem : public Assimp::IOSystem {
public:
    ModelFileSystem(std::string path, std::string_view bytes, bool disk, SideFileReader sideFiles)
        : path_(std::move(path)), bytes_(bytes), disk_(disk), sideFiles_(std::move(sideFiles)) {}
    bool Exists(const char *file) const override {
        if (!file) return false;
        if (isMain(file)) return true;
        if (!disk_) {
            std::string unused;
            return sideFiles_ && sideFiles_(file, unused);
        }
        // Anything but a directory "exists", so that Open can say why it refuses a pipe.
        struct stat st;
        return ::stat(file, &st) == 0 && !S_ISDIR(st.st_mode);
    }
    char getOsSeparator() const override { return '/'; }
    Assimp::IOStream *Open(const char *file, const char *mode) override {
        if (!file || !mode || std::strpbrk(mode, "wa+")) return nullptr;
        if (isMain(file))
            return new Assimp::MemoryIOStream(reinterpret_cast<const uint8_t *>(bytes_.data()),
                                              bytes_.size(), false);
        std::string data, why;
        if (!disk_) {
            if (!sideFiles_ || !sideFiles_(file, data)) return nullptr;
        } else if (!readModelFile(file, kMaxModelFileBytes, data, why)) {
            reportUnreadable(file, why);
            return nullptr;
        }
        // The only side files the OBJ reader opens are material libraries.
        if (lowerExtension(path_) == ".obj") data = mtlFromFirstMaterial(std::move(data));
        auto *copy = new uint8_t[std::max<size_t>(data.size(), 1)];
        std::memcpy(copy, data.data(), data.size());
        return new Assimp::MemoryIOStream(copy, data.size(), true);
    }
    void Close(Assimp::IOStream *stream) override { delete stream; }

private:
    // The library asks for a file more than once, and after a material library that an OBJ
    // file names it tries one named after the model: each file is reported once, and that
    // guess not at all once the named library was reported.
    void reportUnreadable(const std::string &file, const std::string &why) {
        const bool library = lowerExtension(file) == ".mtl";
        const bool guess = library && lowerExtension(path_) == ".obj" &&
                           file == path_.substr(0, path_.size() - 3) + "mtl";
        if (guess && reportedLibrary_) return;
        if (!reported_.insert(file).second) return;
        if (library) {
            reportedLibrary_ = true;
            message(kMsgWarning, 6,
                    "Cannot read the material library %s: %s; the faces that use its materials "
                    "get the default material",
                    file.c_str(), why.c_str());
        } else {
            message(kMsgWarning, 6, "Cannot read %s: %s", file.c_str(), why.c_str());
        }
    }
    bool isMain(const char *file) const {
        if (path_ == file) return true;
        std::error_code ec;
        return disk_ && fs::equivalent(path_, file, ec);
    }
    std::string path_;
    std::string_view bytes_;
    bool disk_;
    SideFileReader sideFiles_;
    std::unordered_set<std::string> reported_;
    bool reportedLibrary_ = false;
};

class ProgressRelay : public Assimp::ProgressHandler {
public:
    explicit ProgressRelay(std::function<void(float)> fn) : fn_(std::move(fn)) {}
    bool Update(float percentage) override {
        if (fn_ && percentage >= 0.0f) fn_(std::min(percentage, 1.0f));
        return true;
    }

private:
    std::function<void(float)> fn_;
};

// ---------------------------------------------------------------------------------------------
// Conversions between the library's types and the scene's.

// The library's matrices act on column vectors; the scene's on row vectors.
Mtx4 toRowMatrix(const aiMatrix4x4 &a) {
    Mtx4 m;
    const float src[4][4] = {{a.a1, a.a2, a.a3, a.a4},
                             {a.b1, a.b2, a.b3, a.b4},
                             {a.c1, a.c2, a.c3, a.c4},
                             {a.d1, a.d2, a.d3, a.d4}};
    for (int i = 0; i < 4; ++i)
        for (int j = 0; j < 4; ++j) m.m[i][j] = src[j][i];
    return m;
}

Vec3 toVec3(const aiVector3D &v) { return {v.x, v.y, v.z}; }

Mtx4 linearPart(const Mtx4 &m) {
    Mtx4 r = m;
    r.m[3][0] = r.m[3][1] = r.m[3][2] = 0.0f;
    return r;
}

// A right-handed frame whose -z axis is forward and whose y axis is as close to up as it can.
void frameFromForward(Vec3 forward, Vec3 up, Vec3 &x, Vec3 &y, Vec3 &z) {
    if (forward.lengthSquared() == 0.0f || !isFinite(forward)) forward = Vec3(0, 0, -1);
    z = (-forward).normalize();
    y = up - z * dot(z, up);
    if (y.lengthSquared() < 1e-12f || !isFinite(y)) {
        Vec3 alt = std::fabs(z.y) < 0.9f ? Vec3(0, 1, 0) : Vec3(1, 0, 0);
        y = alt - z * dot(z, alt);
    }
    y.normalize();
    x = cross(y, z).normalize();
}

Mtx4 rowsMatrix(const Vec3 &x, const Vec3 &y, const Vec3 &z, const Vec3 &p) {
    Mtx4 m;
    const Vec3 rows[4] = {x, y, z, p};
    for (int i = 0; i < 4; ++i) m.m[i][0] = rows[i].x, m.m[i][1] = rows[i].y, m.m[i][2] = rows[i].z;
    return m;
}

Color toColor(const aiColor3D &c) { return Color(c.r, c.g, c.b, 1.0f); }

bool isValidUtf8(const std::string &s) {
    size_t i = 0;
    while (i < s.size()) {
        unsigned char c = static_cast<unsigned char>(s[i]);
        int extra = c < 0x80 ? 0 : (c >> 5) == 6 ? 1 : (c >> 4) == 14 ? 2 : (c >> 3) == 30 ? 3 : -1;
        if (extra < 0 || i + size_t(extra) >= s.size() + (extra == 0 ? 1 : 0)) return false;
        for (int k = 1; k <= extra; ++k)
            if ((static_cast<unsigned char>(s[i + k]) >> 6) != 2) return false;
        if (c < 0x20 && extra == 0) return false;
        i += size_t(extra) + 1;
    }
    return true;
}

// ---------------------------------------------------------------------------------------------

class ModelWalker {
public:
    ModelWalker(const aiScene &scene, const ImportOptions &options, const std::string &path,
                ImportStats &stats)
        : scene_(scene),
          options_(options),
          stats_(stats),
          modelDir_(fs::path(path).parent_path()),
          stem_(sanitizeName(fs::path(path).stem().string(), "model")) {
        const std::string ext = lowerExtension(path);
        gltf_ = ext == ".gltf" || ext == ".glb";
        convert_ = conversionMatrix(options);
        convertLinear_ = linearPart(convert_);
        Mtx4 inv;
        if (convert_.inverse(inv)) convertInverse_ = inv;
        mirror_ = convert_.determinant3() < 0.0f;
        float s = std::cbrt(std::fabs(convert_.determinant3()));
        normalMatrix_ = linearPart(convert_);
        if (s > 0.0f)
            for (int i = 0; i < 3; ++i)
                for (int j = 0; j < 3; ++j) normalMatrix_.m[i][j] /= s;
    }

    bool walk(ImportedModel &model) {
        model_ = &model;
        materialIndex_.assign(scene_.mNumMaterials, -1);
        // Depth first with a stack of its own: node chains may be any number of levels deep.
        // A node met twice (a damaged hierarchy) is walked once.
        std::vector<std::pair<const aiNode *, Mtx4>> stack;
        std::unordered_set<const aiNode *> seen;
        if (scene_.mRootNode) stack.emplace_back(scene_.mRootNode, Mtx4());
        while (!stack.empty()) {
            auto [node, parent] = stack.back();
            stack.pop_back();
            if (!seen.insert(node).second) continue;
            nodeByName_.try_emplace(node->mName.C_Str(), node);
            const Mtx4 world = walkNode(*node, parent, model);
            for (unsigned i = node->mNumChildren; i-- > 0;)
                if (node->mChildren[i]) stack.emplace_back(node->mChildren[i], world);
        }
        for (unsigned i = 0; i < scene_.mNumCameras; ++i) addCamera(*scene_.mCameras[i], model);
        for (unsigned i = 0; i < scene_.mNumLights; ++i) addLight(*scene_.mLights[i], model);
        return true;
    }

private:
    std::string prefixed(const std::string &name, const std::string &fallback) {
        return options_.namePrefix + sanitizeName(name, fallback);
    }

    // The glTF reader also copies a camera's or light's node translation into its own position,
    // which would apply it twice.
    Vec3 ownPosition(const aiString &name, const aiVector3D &position) const {
        Vec3 p = toVec3(position);
        const aiNode *node = findNode(name);
        if (gltf_ && node &&
            p == Vec3(node->mTransformation.a4, node->mTransformation.b4, node->mTransformation.c4))
            return Vec3();
        return p;
    }

    // The first node of the name in walking order, as the library's own (recursive) search.
    const aiNode *findNode(const aiString &name) const {
        auto found = nodeByName_.find(name.C_Str());
        return found == nodeByName_.end() ? nullptr : found->second;
    }

    Mtx4 nodeWorld(const aiString &name) const {
        const aiNode *node = findNode(name);
        Mtx4 world;
        for (; node; node = node->mParent) world = world * toRowMatrix(node->mTransformation);
        return world;
    }

    // Adds the instance of one node; returns its world matrix for its children.
    Mtx4 walkNode(const aiNode &node, const Mtx4 &parent, ImportedModel &model) {
        const Mtx4 world = toRowMatrix(node.mTransformation) * parent;
        std::vector<unsigned> meshes;
        for (unsigned i = 0; i < node.mNumMeshes; ++i) {
            unsigned m = node.mMeshes[i];
            if (m < scene_.mNumMeshes && scene_.mMeshes[m]->mNumFaces > 0 &&
                (scene_.mMeshes[m]->mPrimitiveTypes & aiPrimitiveType_TRIANGLE))
                meshes.push_back(m);
        }
        if (!meshes.empty()) {
            auto found = shapeOf_.find(meshes);
            size_t shapeIndex;
            if (found != shapeOf_.end()) {
                shapeIndex = found->second;
            } else {
                shapeIndex = model.shapes.size();
                std::string base = node.mName.length ? node.mName.C_Str()
                                                     : scene_.mMeshes[meshes[0]]->mName.C_Str();
                model.shapes.push_back(
                    buildShape(uniqueName(prefixed(base, stem_), shapeNames_), meshes, model));
                shapeOf_.emplace(meshes, shapeIndex);
            }
            ImportedInstance instance;
            instance.name = uniqueName(prefixed(node.mName.C_Str(), stem_), instanceNames_);
            instance.shape = model.shapes[shapeIndex].name;
            // Shapes are stored converted, so the placement is conjugated by the conversion.
            instance.objectToWorld = convertInverse_ * world * convert_;
            model.instances.push_back(std::move(instance));
        }
        return world;
    }

    ImportedShape buildShape(const std::string &name, const std::vector<unsigned> &meshes,
                             ImportedModel &model) {
        ImportedShape shape;
        shape.name = name;
        // The union of the meshes' UV channels and colours; a mesh lacking one gets zeros
        // (UVs) or white (colours).
        unsigned uvCount = 0;
        bool colors = false;
        for (unsigned m : meshes) {
            const aiMesh &mesh = *scene_.mMeshes[m];
            for (unsigned c = 0; c < AI_MAX_NUMBER_OF_TEXTURECOORDS; ++c)
                if (mesh.mTextureCoords[c]) uvCount = std::max(uvCount, c + 1);
            colors = colors || mesh.mColors[0] != nullptr;
        }
        shape.uvSets.resize(uvCount);
        shape.uvSetNames.resize(uvCount);
        std::unordered_set<std::string> setNames;
        for (unsigned c = 0; c < uvCount; ++c) {
            std::string setName;
            for (unsigned m : meshes)
                if (scene_.mMeshes[m]->HasTextureCoordsName(c)) {
                    setName = sanitizeName(scene_.mMeshes[m]->GetTextureCoordsName(c)->C_Str(), "");
                    break;
                }
            if (setName.empty()) setName = "uv" + std::to_string(c);
            shape.uvSetNames[c] = uniqueName(setName, setNames);
        }

        for (unsigned m : meshes) {
            const aiMesh &mesh = *scene_.mMeshes[m];
            const uint32_t base = uint32_t(shape.positions.size());
            for (unsigned v = 0; v < mesh.mNumVertices; ++v) {
                shape.positions.push_back(convert_.transformPoint(toVec3(mesh.mVertices[v])));
                Vec3 n = mesh.mNormals ? toVec3(mesh.mNormals[v]) : Vec3();
                shape.normals.push_back(normalMatrix_.transformVector(n).normalize());
                Vec3 t, b;
                if (mesh.mTangents && mesh.mBitangents) {
                    t = convertLinear_.transformVector(toVec3(mesh.mTangents[v])).normalize();
                    b = convertLinear_.transformVector(toVec3(mesh.mBitangents[v])).normalize();
                    if (!isFinite(t) || !isFinite(b)) t = b = Vec3();
                }
                shape.tangents.push_back(t);
                shape.bitangents.push_back(b);
                if (colors) {
                    const aiColor4D *c = mesh.mColors[0];
                    shape.colors.push_back(c ? Color(c[v].r, c[v].g, c[v].b, c[v].a)
                                             : Color::white());
                }
                for (unsigned c = 0; c < uvCount; ++c) {
                    const aiVector3D *uv = mesh.mTextureCoords[c];
                    shape.uvSets[c].push_back(uv ? Vec2(uv[v].x, uv[v].y) : Vec2());
                }
            }
            ImportedGroup group;
            group.material = materialName(mesh.mMaterialIndex, mesh.mColors[0] != nullptr, model);
            group.indices.reserve(size_t(mesh.mNumFaces) * 3);
            for (unsigned f = 0; f < mesh.mNumFaces; ++f) {
                const aiFace &face = mesh.mFaces[f];
                if (face.mNumIndices != 3) continue;
                uint32_t i0 = base + face.mIndices[0], i1 = base + face.mIndices[1],
                         i2 = base + face.mIndices[2];
                group.indices.insert(group.indices.end(),
                                     {i0, mirror_ ? i2 : i1, mirror_ ? i1 : i2});
            }
            // Meshes of one material are kept in one group.
            auto same =
                std::find_if(shape.groups.begin(), shape.groups.end(),
                             [&](const ImportedGroup &g) { return g.material == group.material; });
            if (same != shape.groups.end())
                same->indices.insert(same->indices.end(), group.indices.begin(),
                                     group.indices.end());
            else
                shape.groups.push_back(std::move(group));
        }
        completeTangentFrames(shape);
        return shape;
    }

    std::string materialName(unsigned index, bool vertexColors, ImportedModel &model) {
        if (index >= scene_.mNumMaterials) index = 0;
        if (scene_.mNumMaterials == 0) {
            if (defaultMaterial_.empty()) {
                ImportedMaterial mat;
                mat.name = uniqueName(prefixed("default", "default"), materialNames_);
                mat.diffuse.color = Color(0.8f, 0.8f, 0.8f, 1.0f);
                mat.diffuse.scale = 1.0f;
                mat.diffuse.useVertexColor = vertexColors;
                defaultMaterial_ = mat.name;
                model.materials.push_back(std::move(mat));
            }
            return defaultMaterial_;
        }
        if (materialIndex_[index] < 0) {
            materialIndex_[index] = int(model.materials.size());
            model.materials.push_back(convertMaterial(*scene_.mMaterials[index], vertexColors));
        }
        return model.materials[size_t(materialIndex_[index])].name;
    }

    // Reads one texture channel: the file of the first texture of the type, if any.
    bool readTexture(const aiMaterial &mat, aiTextureType type, ImportedChannel &channel) {
        if (mat.GetTextureCount(type) == 0) return false;
        aiString file;
        unsigned uvIndex = 0;
        if (mat.GetTexture(type, 0, &file, nullptr, &uvIndex) != AI_SUCCESS) return false;
        std::string name = file.C_Str();
        if (name.empty()) return false;
        if (const aiTexture *embedded = scene_.GetEmbeddedTexture(file.C_Str())) {
            channel.embeddedImage = embeddedImage(*embedded, name);
            if (channel.embeddedImage < 0) return false;
            if (uvIndex > 0) channel.uvLayerOverride = "uv" + std::to_string(uvIndex);
            channel.scale = 1.0f;
            channel.color = Color::white();
            return true;
        }
        if (name[0] == '*') {
            ++stats_.missingTextures;
            message(kMsgWarning, 6, "Texture %s refers to an image the model does not hold",
                    name.c_str());
            return false;
        }
        if (!isValidUtf8(name)) {
            ++stats_.missingTextures;
            message(kMsgWarning, 6, "Texture file name is not valid text, skipping it");
            return false;
        }
        std::replace(name.begin(), name.end(), '\\', '/');
        fs::path p(name);
        if (p.is_relative()) p = modelDir_ / p;
        std::error_code ec;
        if (fs::exists(p, ec)) {
            fs::path abs = fs::absolute(p, ec);
            channel.fileTexture = (ec ? p : abs).lexically_normal().string();
        } else {
            ++stats_.missingTextures;
            message(kMsgWarning, 6, "Texture file %s not found; the material keeps the name",
                    p.string().c_str());
            channel.fileTexture = p.lexically_normal().string();
        }
        if (uvIndex > 0) channel.uvLayerOverride = "uv" + std::to_string(uvIndex);
        channel.scale = 1.0f;
        channel.color = Color::white();
        return true;
    }

    // Keeps an image stored inside the model for writing: compressed images as they are, raw
    // texels as an uncompressed 32-bit TGA. Returns its index, or -1 when it cannot be used.
    int embeddedImage(const aiTexture &texture, const std::string &reference) {
        auto known = imageOf_.find(&texture);
        if (known != imageOf_.end()) return known->second;
        ImportedImage image;
        std::string ext;
        if (texture.mHeight == 0) {
            if (!texture.pcData || texture.mWidth == 0) return -1;
            image.bytes.assign(reinterpret_cast<const char *>(texture.pcData), texture.mWidth);
            ext = sanitizeName(std::string(texture.achFormatHint,
                                           strnlen(texture.achFormatHint, HINTMAXTEXTURELEN)),
                               "bin");
        } else {
            if (!texture.pcData || texture.mWidth > 65535 || texture.mHeight > 65535) {
                ++stats_.missingTextures;
                message(kMsgWarning, 6, "Embedded texture %s is too large, skipping it",
                        reference.c_str());
                return -1;
            }
            const uint16_t w = uint16_t(texture.mWidth), h = uint16_t(texture.mHeight);
            const unsigned char header[18] = {0,
                                              0,
                                              2,
                                              0,
                                              0,
                                              0,
                                              0,
                                              0,
                                              0,
                                              0,
                                              0,
                                              0,
                                              uint8_t(w & 0xff),
                                              uint8_t(w >> 8),
                                              uint8_t(h & 0xff),
                                              uint8_t(h >> 8),
                                              32,
                                              0x28};
            image.bytes.assign(reinterpret_cast<const char *>(header), sizeof header);
            // The texels are blue, green, red, alpha from the top row down, as the header says.
            image.bytes.append(reinterpret_cast<const char *>(texture.pcData),
                               size_t(w) * h * sizeof(aiTexel));
            ext = "tga";
        }
        std::string base = texture.mFilename.length
                               ? fs::path(texture.mFilename.C_Str()).stem().string()
                               : stem_ + "_texture" + std::to_string(model_->images.size());
        image.fileName = uniqueName(sanitizeName(base, "texture") + "." + ext, imageNames_);
        ++stats_.embeddedTextures;
        int index = int(model_->images.size());
        model_->images.push_back(std::move(image));
        imageOf_.emplace(&texture, index);
        return index;
    }

    ImportedMaterial convertMaterial(const aiMaterial &mat, bool vertexColors) {
        ImportedMaterial out;
        aiString name;
        mat.Get(AI_MATKEY_NAME, name);
        out.name = uniqueName(prefixed(name.C_Str(), "material"), materialNames_);
        aiColor3D c;
        int twosided = 0;
        if (mat.Get(AI_MATKEY_TWOSIDED, twosided) == AI_SUCCESS) out.twosided = twosided != 0;
        float shininess = 0.0f;
        if (mat.Get(AI_MATKEY_SHININESS, shininess) == AI_SUCCESS && shininess > 0.0f &&
            std::isfinite(shininess))
            out.shininess = shininess;

        out.diffuse.color = Color(0.8f, 0.8f, 0.8f, 1.0f);
        if (mat.Get(AI_MATKEY_COLOR_DIFFUSE, c) == AI_SUCCESS) out.diffuse.color = toColor(c);
        out.diffuse.scale = 1.0f;
        if (!readTexture(mat, aiTextureType_DIFFUSE, out.diffuse))
            if (!readTexture(mat, aiTextureType_BASE_COLOR, out.diffuse))
                out.diffuse.useVertexColor = vertexColors;

        // Ambient colours of exchange formats are mostly left-overs of fixed-function
        // pipelines (often white); only an ambient texture is carried over.
        readTexture(mat, aiTextureType_AMBIENT, out.ambient);

        float opacity = 1.0f;
        if (mat.Get(AI_MATKEY_OPACITY, opacity) == AI_SUCCESS && opacity < 1.0f &&
            opacity >= 0.0f) {
            float t = 1.0f - opacity;
            out.transparency.color = Color(t, t, t, 1.0f);
            out.transparency.scale = 1.0f;
        }
        ImportedChannel opacityMap;
        if (readTexture(mat, aiTextureType_OPACITY, opacityMap)) {
            // An opacity map that is the diffuse image's own alpha is said so; any other is an
            // opacity (white = solid) where the channel wants transparency (white = clear).
            if (!opacityMap.fileTexture.empty() &&
                opacityMap.fileTexture == out.diffuse.fileTexture) {
                out.diffuseAlphaAsTransparency = true;
            } else {
                message(kMsgWarning, 6,
                        "Material %s: its opacity map is used as the transparency map, where "
                        "white means clear",
                        out.name.c_str());
                out.transparency = opacityMap;
            }
        }

        if (mat.Get(AI_MATKEY_COLOR_EMISSIVE, c) == AI_SUCCESS && (c.r > 0 || c.g > 0 || c.b > 0))
            out.emissive.color = toColor(c), out.emissive.scale = 1.0f;
        readTexture(mat, aiTextureType_EMISSIVE, out.emissive);

        // A specular colour without an exponent is a reader's default, not a highlight.
        if (shininess > 0.0f && mat.Get(AI_MATKEY_COLOR_SPECULAR, c) == AI_SUCCESS &&
            (c.r > 0 || c.g > 0 || c.b > 0)) {
            out.specular.color = toColor(c);
            float strength = 1.0f;
            mat.Get(AI_MATKEY_SHININESS_STRENGTH, strength);
            out.specular.scale = std::isfinite(strength) && strength > 0.0f ? strength : 1.0f;
        }
        readTexture(mat, aiTextureType_SPECULAR, out.specular);

        if (mat.Get(AI_MATKEY_COLOR_REFLECTIVE, c) == AI_SUCCESS && (c.r > 0 || c.g > 0 || c.b > 0))
            out.reflection.color = toColor(c), out.reflection.scale = 1.0f;
        readTexture(mat, aiTextureType_REFLECTION, out.reflection);

        readTexture(mat, aiTextureType_NORMALS, out.normal);
        return out;
    }

    void addCamera(const aiCamera &cam, ImportedModel &model) {
        const Mtx4 world = nodeWorld(cam.mName) * convert_;
        const Mtx4 linear = linearPart(world);
        Vec3 p = world.transformPoint(ownPosition(cam.mName, cam.mPosition));
        Vec3 forward = linear.transformVector(toVec3(cam.mLookAt));
        Vec3 up = linear.transformVector(toVec3(cam.mUp));
        Vec3 x, y, z;
        frameFromForward(forward, up, x, y, z);
        ImportedCamera out;
        out.name = uniqueName(prefixed(cam.mName.C_Str(), "camera"), cameraNames_);
        out.objectToWorld = rowsMatrix(x, y, z, p);
        if (cam.mOrthographicWidth > 0.0f) {
            out.type = ImportedCameraType::kOrtho;
            float scale = std::cbrt(std::fabs(convert_.determinant3()));
            float w = 2.0f * cam.mOrthographicWidth * scale;
            out.imagePlaneSize = Vec2(w, cam.mAspect > 0.0f ? w / cam.mAspect : w);
        } else {
            // The readers store the full horizontal angle here.
            float h = cam.mHorizontalFOV;
            if (!(h > 0.0f && h < std::numbers::pi_v<float>)) h = std::numbers::pi_v<float> / 3.0f;
            float v = cam.mAspect > 0.0f ? 2.0f * std::atan(std::tan(h * 0.5f) / cam.mAspect) : h;
            out.fov = Vec2(h, v);
        }
        model.cameras.push_back(std::move(out));
    }

    void addLight(const aiLight &light, ImportedModel &model) {
        const Mtx4 world = nodeWorld(light.mName) * convert_;
        const Mtx4 linear = linearPart(world);
        Vec3 p = world.transformPoint(ownPosition(light.mName, light.mPosition));
        Vec3 dir = linear.transformVector(toVec3(light.mDirection));
        Vec3 up = linear.transformVector(toVec3(light.mUp));
        if (up.lengthSquared() == 0.0f) up = Vec3(0, 1, 0);
        ImportedLight out;
        out.name = uniqueName(prefixed(light.mName.C_Str(), "light"), lightNames_);
        out.color = toColor(light.mColorDiffuse);
        if (light.mAttenuationQuadratic > 0.0f)
            out.falloffExponent = 2.0f;
        else if (light.mAttenuationLinear > 0.0f)
            out.falloffExponent = 1.0f;
        Vec3 x, y, z;
        switch (light.mType) {
            case aiLightSource_POINT:
                out.type = ImportedLightType::kPoint;
                out.objectToWorld = Mtx4::translation(p);
                break;
            case aiLightSource_DIRECTIONAL: {
                // Directional lights shine along local -y: row 1 is the negated direction.
                out.type = ImportedLightType::kDirectional;
                out.falloffExponent = 0.0f;
                frameFromForward(dir, up, x, y, z);
                out.objectToWorld = rowsMatrix(x, z, -y, p);
                break;
            }
            case aiLightSource_SPOT: {
                // Spot lights too shine along local -y.
                out.type = ImportedLightType::kSpot;
                frameFromForward(dir, up, x, y, z);
                out.objectToWorld = rowsMatrix(x, z, -y, p);
                // glTF files give the angle from the axis to the edge; the others the full cone.
                const float factor = gltf_ ? 2.0f : 1.0f;
                float inner = light.mAngleInnerCone * factor,
                      outer = light.mAngleOuterCone * factor;
                if (!(outer > 0.0f) || !std::isfinite(outer)) outer = std::numbers::pi_v<float> / 4;
                if (!(inner >= 0.0f) || inner > outer) inner = outer;
                const float toDegrees = 180.0f / std::numbers::pi_v<float>;
                out.coneAngleDegrees = inner * toDegrees;
                out.penumbraAngleDegrees = (outer - inner) * 0.5f * toDegrees;
                break;
            }
            case aiLightSource_AREA: {
                out.type = ImportedLightType::kArea;
                frameFromForward(dir, up, x, y, z);
                float scale = std::cbrt(std::fabs(convert_.determinant3()));
                float w = light.mSize.x > 0.0f ? light.mSize.x * scale : scale;
                float h = light.mSize.y > 0.0f ? light.mSize.y * scale : scale;
                // The square's normal, local +z, is the direction it shines in.
                out.objectToWorld = rowsMatrix(x * (0.5f * w), -y * (0.5f * h), -z, p);
                break;
            }
            case aiLightSource_AMBIENT:
                out.type = ImportedLightType::kEnvironment;
                out.color = toColor(light.mColorAmbient);
                out.falloffExponent = 0.0f;
                break;
            default:
                ++stats_.unsupportedLights;
                message(kMsgWarning, 6, "Light %s is of a kind the scene cannot show, skipping it",
                        light.mName.C_Str());
                return;
        }
        model.lights.push_back(std::move(out));
    }

    const aiScene &scene_;
    const ImportOptions &options_;
    ImportStats &stats_;
    fs::path modelDir_;
    std::string stem_;
    bool gltf_ = false;
    ImportedModel *model_ = nullptr;
    std::map<const aiTexture *, int> imageOf_;
    std::unordered_set<std::string> imageNames_;
    Mtx4 convert_, convertInverse_, convertLinear_, normalMatrix_;
    bool mirror_ = false;
    std::map<std::vector<unsigned>, size_t> shapeOf_;
    std::unordered_map<std::string, const aiNode *> nodeByName_;
    std::vector<int> materialIndex_;
    std::string defaultMaterial_;
    std::unordered_set<std::string> shapeNames_, instanceNames_, materialNames_, cameraNames_,
        lightNames_;
};

// Drops faces the later steps cannot take: corners that do not exist, corners at NaN or
// infinite positions, and points and lines; counts the polygons that will be triangulated.
void sanitizeMeshes(aiScene &scene, ImportStats &stats) {
    for (unsigned m = 0; m < scene.mNumMeshes; ++m) {
        aiMesh *mesh = scene.mMeshes[m];
        if (!mesh) continue;
        if (!mesh->mVertices) mesh->mNumVertices = 0;
        std::vector<uint8_t> finite(mesh->mNumVertices);
        for (unsigned v = 0; v < mesh->mNumVertices; ++v) {
            const aiVector3D &p = mesh->mVertices[v];
            finite[v] = std::isfinite(p.x) && std::isfinite(p.y) && std::isfinite(p.z);
        }
        unsigned kept = 0;
        unsigned primitives = 0;
        for (unsigned f = 0; f < mesh->mNumFaces; ++f) {
            aiFace &face = mesh->mFaces[f];
            bool drop = false;
            if (face.mNumIndices < 3 || !face.mIndices) {
                ++stats.pointsAndLines;
                drop = true;
            } else {
                bool bad = false, nonFinite = false;
                for (unsigned k = 0; k < face.mNumIndices; ++k) {
                    unsigned i = face.mIndices[k];
                    if (i >= mesh->mNumVertices)
                        bad = true;
                    else if (!finite[i])
                        nonFinite = true;
                }
                if (bad)
                    ++stats.badIndexFaces, drop = true;
                else if (nonFinite)
                    ++stats.nonFiniteFaces, drop = true;
                else if (face.mNumIndices > kMaxPolygonCorners)
                    ++stats.hugePolygons, drop = true;
                else if (face.mNumIndices > 3)
                    ++stats.polygonsTriangulated;
            }
            if (drop) continue;
            primitives |=
                face.mNumIndices == 3 ? aiPrimitiveType_TRIANGLE : aiPrimitiveType_POLYGON;
            // Swapping keeps every index array owned by exactly one face of the array.
            if (kept != f) {
                std::swap(mesh->mFaces[kept].mIndices, face.mIndices);
                std::swap(mesh->mFaces[kept].mNumIndices, face.mNumIndices);
            }
            ++kept;
        }
        mesh->mNumFaces = kept;
        // Positions no face uses may still be NaN; they must not reach the later steps.
        for (unsigned v = 0; v < mesh->mNumVertices; ++v)
            if (!finite[v]) mesh->mVertices[v] = aiVector3D(0, 0, 0);
        // The kinds of face are those that remain: a polygon kind left behind by a dropped face
        // makes the triangulation fail its own count. An emptied mesh claims triangles, which
        // the later steps expect of every mesh; the walk skips meshes without faces.
        if (kept == 0) ++stats.emptyMeshes;
        mesh->mPrimitiveTypes = kept == 0 ? unsigned(aiPrimitiveType_TRIANGLE) : primitives;
        if (scene.mNumMaterials > 0 && mesh->mMaterialIndex >= scene.mNumMaterials)
            mesh->mMaterialIndex = 0;
    }
}

const char *const kTooMuchMemory = "out of memory (a damaged file, or --max-memory too small?)";

// The reader's reason; a failed allocation (the library reports the exception's name) in words.
std::string readerError(const Assimp::Importer &importer) {
    std::string text = importer.GetErrorString();
    if (text.find("bad_alloc") != std::string::npos) return kTooMuchMemory;
    return text.empty() ? "unknown reason" : text;
}

}  // namespace

Mtx4 conversionMatrix(const ImportOptions &options) {
    Mtx4 axes;
    if (options.upAxis == UpAxis::kZ) {
        // x stays, y becomes -z, z becomes y.
        axes = rowsMatrix(Vec3(1, 0, 0), Vec3(0, 0, -1), Vec3(0, 1, 0), Vec3());
    } else if (options.upAxis == UpAxis::kX) {
        // x becomes y, y becomes -x, z stays.
        axes = rowsMatrix(Vec3(0, 1, 0), Vec3(-1, 0, 0), Vec3(0, 0, 1), Vec3());
    }
    Mtx4 mirror;
    if (options.flipHandedness) mirror.m[2][2] = -1.0f;
    return mirror * axes *
           Mtx4::scale(Vec3(options.unitScale, options.unitScale, options.unitScale));
}

std::string sanitizeName(const std::string &name, const std::string &fallback) {
    std::string out;
    out.reserve(name.size());
    for (char ch : name) {
        unsigned char c = static_cast<unsigned char>(ch);
        bool ok = c > 0x20 && c < 0x7f && c != '/' && c != '\\' && c != ':' && c != '*' &&
                  c != '?' && c != '"' && c != '<' && c != '>' && c != '|';
        out.push_back(ok ? ch : '_');
    }
    if (out.empty() || out == "." || out == "..") out = fallback;
    if (out.size() > 200) out.resize(200);
    return out;
}

namespace {

// Reads a model whose main file is already in memory; side files come from the disk only when
// disk is set.
bool readModelBytes(const std::string &path, std::string bytes, bool disk,
                    const SideFileReader &sideFiles, const ImportOptions &options,
                    ImportedModel &model, ImportStats &stats) {
    if (!(options.unitScale > 0.0f) || !std::isfinite(options.unitScale)) {
        message(kMsgError, 6, "Unit scale must be a positive number");
        return false;
    }
    try {
        const std::string ext = lowerExtension(path);
        std::string why;
        if (!checkDeclaredSizes(ext, bytes, why)) {
            message(kMsgError, 6, "Cannot read model %s: %s", path.c_str(), why.c_str());
            return false;
        }
        if (ext == ".obj") {
            std::string filtered;
            uint64_t dropped = 0;
            if (filterObjFaces(bytes, filtered, dropped)) {
                stats.badIndexFaces += dropped;
                bytes = std::move(filtered);
            }
        }
        Assimp::Importer importer;
        importer.SetPropertyFloat(AI_CONFIG_PP_GSN_MAX_SMOOTHING_ANGLE,
                                  std::clamp(options.smoothingAngleDegrees, 0.0f, 175.0f));
        if (options.progress) importer.SetProgressHandler(new ProgressRelay(options.progress));
        importer.SetIOHandler(new ModelFileSystem(path, bytes, disk, sideFiles));

        const aiScene *read = importer.ReadFile(path, 0);
        if (!read) {
            message(kMsgError, 6, "Cannot read model %s: %s", path.c_str(),
                    readerError(importer).c_str());
            return false;
        }
        sanitizeMeshes(*const_cast<aiScene *>(read), stats);
        unsigned flags = aiProcess_Triangulate | aiProcess_GenSmoothNormals |
                         aiProcess_CalcTangentSpace | aiProcess_SortByPType;
        if (options.weld) flags |= aiProcess_JoinIdenticalVertices;
        const aiScene *scene = importer.ApplyPostProcessing(flags);
        if (!scene) {
            message(kMsgError, 6, "Cannot read model %s: %s", path.c_str(),
                    readerError(importer).c_str());
            return false;
        }
        ImportedModel result;
        ModelWalker walker(*scene, options, path, stats);
        walker.walk(result);
        model = std::move(result);
    } catch (const std::bad_alloc &) {
        message(kMsgError, 6, "Cannot read model %s: %s", path.c_str(), kTooMuchMemory);
        return false;
    } catch (const std::exception &e) {
        message(kMsgError, 6, "Cannot read model %s: %s", path.c_str(), e.what());
        return false;
    }
    return true;
}

}  // namespace

bool readModel(const std::string &path, const ImportOptions &options, ImportedModel &model,
               ImportStats &stats) {
    std::string bytes, why;
    if (!readModelFile(path, kMaxModelFileBytes, bytes, why)) {
        message(kMsgError, 6, "Cannot read model %s: %s", path.c_str(), why.c_str());
        return false;
    }
    return readModelBytes(path, std::move(bytes), true, {}, options, model, stats);
}

bool readModelFromMemory(const std::string &name, std::string_view bytes,
                         const ImportOptions &options, ImportedModel &model, ImportStats &stats,
                         const SideFileReader &sideFiles) {
    return readModelBytes(name, std::string(bytes), false, sideFiles, options, model, stats);
}

}  // namespace ox
