#include "scene/loader.h"

#include <cmath>
#include <new>
#include <unordered_map>

#include "core/message.h"
#include "core/timer.h"
#include "scene/material_converter.h"
#include "scene/scene_elements.h"
#include "scene/vtm.h"
#include "shading/texture_lookup.h"

namespace ox {
namespace {

constexpr float kDefaultBias = 0.005f;

LinkMode linkMode(int32_t v) {
    switch (v) {
        case 0:
            return LinkMode::kInclusive;
        case 1:
            return LinkMode::kExclusive;
        default:
            return LinkMode::kNone;
    }
}

void bench(const char *format, const Timer &t) {
    message(kMsgBench, 6, format, t.format().c_str());
}

// Makes the instance of a record; null when its placement cannot be used.
std::unique_ptr<Instance> createInstance(const XMLInstanceCompact &r, const Shape &shape,
                                         SceneMaterialResolver &resolver) {
    if (r.materialOverrides.size() > 1)
        message(kMsgWarning, 6,
                "Provided more than one material override for instance %s, using only the first "
                "for the entire shape",
                r.name.c_str());
    const Material *override = nullptr;
    if (!r.materialOverrides.empty() && !r.materialOverrides[0].empty()) {
        override = resolver.resolve(r.materialOverrides[0], shape.vertices().uvSetNames());
        if (!override)
            message(kMsgWarning, 6,
                    "Failed to find override material %s on instance %s, using default",
                    r.materialOverrides[0].c_str(), r.name.c_str());
    }
    auto inst = Instance::create(r.name, r.objectToWorld, &shape, override, r.renderStats.flags);
    if (!inst) return nullptr;
    auto options = std::make_unique<VertexBakeSamplingOptions>();
    options->type = r.vertexBakeSamplingOptions.type;
    options->minSamples = r.vertexBakeSamplingOptions.minSamples;
    options->maxSamples = r.vertexBakeSamplingOptions.maxSamples;
    options->subDivStepSize = r.vertexBakeSamplingOptions.subDivStepSize;
    options->footPrintScale = r.vertexBakeSamplingOptions.footPrintScale;
    inst->setVertexBakeSamplingOptions(std::move(options));
    return inst;
}

std::unique_ptr<Camera> createCamera(const XMLCameraCompact &r,
                                     const EnvironmentShaderInterface *env) {
    switch (SceneCameraType(r.type)) {
        case SceneCameraType::PERSPECTIVE:
            return std::make_unique<PerspectiveCamera>(r.name, r.objectToWorld, env, r.fov.x,
                                                       r.fov.y, r.imagePlaneShift, 0, 0, 0.0f,
                                                       0.0f);
        case SceneCameraType::ORTHO:
            return std::make_unique<OrthoCamera>(r.name, r.objectToWorld, env, r.imagePlaneSize);
        case SceneCameraType::ENVIRONMENT: {
            EnvCamera::Projection projection;
            if (!EnvCamera::projectionFromIndex(r.environmentType, projection)) return nullptr;
            return std::make_unique<EnvCamera>(r.name, r.objectToWorld, env, projection);
        }
        default:
            return nullptr;
    }
}

// Loads a spot light's gobo through the texture manager; a file that cannot be decoded leaves
// the light without gobo (after one message naming it).
void attachGobo(SimpleSpotLight &spot, TextureFactory &textures) {
    if (spot.goboFile().empty()) return;
    std::shared_ptr<const OXTexture> texture = textures.getTexture(spot.goboFile(), kFilterEWA);
    if (!texture || texture->resolution().x <= 0 || texture->resolution().y <= 0) {
        message(kMsgError, 3, "Gobo file %s failed to load", spot.goboFile().c_str());
        return;
    }
    spot.setGoboTexture(std::make_shared<OXTextureLookup>(std::move(texture)));
}

}  // namespace

std::string fileExtension(const std::string &path) {
    const size_t slash = path.find_last_of('/');
    const size_t start = slash == std::string::npos ? 0 : slash + 1;
    const size_t dot = path.find_last_of('.');
    if (dot == std::string::npos || dot < start) return {};
    return path.substr(dot + 1);
}

float automaticBias(const BBox &box) {
    if (!box.isValid()) return 0.0f;
    const Vec3 c = box.center();
    const Vec3 d = box.extent();
    const double lc = std::sqrt(double(c.x) * c.x + double(c.y) * c.y + double(c.z) * c.z);
    const double ld = std::sqrt(double(d.x) * d.x + double(d.y) * d.y + double(d.z) * d.z);
    const double b = std::fmax(lc / 100000.0, ld / 100000.0);
    return std::isfinite(b) ? static_cast<float>(b) : 0.0f;
}

bool CreateTempShapeWork::run(const std::atomic<bool> &, int) {
    try {
        vtm::OpenStatus status;
        std::string why;
        auto reader = vtm::TempMeshReaderFactory::instance().open(path_, &status, &why);
        if (!reader) {
            // The file was readable when the scene was loaded: a shape lost now fails the load.
            std::string text = (status == vtm::OpenStatus::kBadHeader ? "Error reading header in "
                                                                      : "Error reading ") +
                               path_;
            if (!why.empty()) text += ": " + why;
            setError(text);
            return false;
        }
        std::unique_ptr<Shape> shape;
        std::string failure;
        switch (buildTempShape(*reader, materials_, options_, shape, failure)) {
            case ShapeBuildStatus::kBuilt:
                slot_ = std::move(shape);
                return true;
            case ShapeBuildStatus::kEmpty:
                messageText(kMsgWarning, 6, "Empty mesh '" + path_ + "' added.");
                return true;
            case ShapeBuildStatus::kFailed:
                setError(failure);
                return false;
        }
    } catch (const std::exception &e) {
        setError(std::string("Building the shape of ") + path_ + " failed: " + e.what());
    }
    return false;
}

bool ZPXLoader::load(const std::vector<std::string> &inputs, const SceneLoadSettings &settings,
                     Scene &scene, std::string &error) {
    auto fail = [&error](std::string text) {
        error = std::move(text);
        return false;
    };
    message(kMsgProgress, 6, "Loading Scene File");
    Timer loadTimer;
    loadTimer.start();

    // Inputs: mesh files are pre-opened for their name and box, scene documents are read.
    std::vector<std::unique_ptr<SceneCompactBase>> records;
    std::unordered_map<std::string, BBox> shapeBounds;
    std::vector<std::string> meshPaths;
    bool sceneInput = false;
    for (const std::string &path : inputs) {
        const std::string ext = fileExtension(path);
        sceneInput = sceneInput || ext == "vtm" || ext == "xml";
        if (ext == "vtm") {
            std::string why;
            auto reader = vtm::TempMeshReaderFactory::instance().open(path, nullptr, &why);
            if (!reader) {
                message(kMsgError, 6, "Failed to preopen file %s", path.c_str());
                if (!why.empty()) messageText(kMsgError, 6, path + ": " + why);
                return fail("Failed to preopen file " + path);
            }
            message(kMsgDebug, 6, "Sucessfully preopened %s", path.c_str());
            shapeBounds.try_emplace(reader->shapeName(), reader->bounds());
            meshPaths.push_back(path);
        } else if (ext == "xml") {
            std::string why;
            if (!readSceneFile(path, records, why)) return fail(why);
        } else {
            message(kMsgWarning, 6, "Don't know what to do with file: %s", path.c_str());
        }
    }
    // Inputs that are all skipped would leave an empty scene that looks like a success.
    if (!sceneInput) {
        message(kMsgError, 6, "No scene or mesh file among the inputs");
        return fail("No scene or mesh file among the inputs");
    }
    loadTimer.stop();
    bench("ZPX Loading time: %s", loadTimer);

    std::vector<const XMLInstanceCompact *> instanceRecords;
    std::vector<const XMLLightSourceCompact *> lightRecords;
    std::vector<const XMLCameraCompact *> cameraRecords;
    std::vector<const XMLMaterialCompact *> materialRecords;
    for (const auto &r : records) {
        if (auto *i = dynamic_cast<const XMLInstanceCompact *>(r.get()))
            instanceRecords.push_back(i);
        else if (auto *l = dynamic_cast<const XMLLightSourceCompact *>(r.get()))
            lightRecords.push_back(l);
        else if (auto *c = dynamic_cast<const XMLCameraCompact *>(r.get()))
            cameraRecords.push_back(c);
        else if (auto *m = dynamic_cast<const XMLMaterialCompact *>(r.get()))
            materialRecords.push_back(m);
    }

    // The scene box, from the mesh headers and the placements, before any mesh is loaded.
    Timer boxTimer;
    boxTimer.start();
    BBox sceneBox;
    for (const XMLInstanceCompact *r : instanceRecords) {
        auto it = shapeBounds.find(r->shape);
        if (it == shapeBounds.end()) {
            message(kMsgWarning, 6, "Base shape %s not found for instance %s", r->shape.c_str(),
                    r->name.c_str());
            continue;
        }
        sceneBox.extend(transformBox(it->second, r->objectToWorld));
    }
    boxTimer.stop();
    bench("Scene bounding box time: %s", boxTimer);

    auto converter = std::make_unique<ZPXMaterialConverter>(sceneBox, &scene.textures());
    const ZPXMaterialConverter &materialConverter = *converter;
    scene.setMaterialConverter(std::move(converter));
    {
        std::string why;
        if (!scene.environment().create(settings.environment, why, &scene.textures())) {
            messageText(kMsgError, 6, "Unable to create environment: " + why);
            return fail("Unable to create environment");
        }
    }

    // Cameras, and the default camera when the scene has none.
    const EnvironmentShaderInterface *env = scene.environment().rtShader();
    for (const XMLCameraCompact *r : cameraRecords) {
        message(kMsgInfo, 6, "Creating camera: %s", r->name.c_str());
        if (auto camera = createCamera(*r, env)) scene.addCamera(std::move(camera));
    }
    if (scene.cameras().empty()) {
        if (settings.jobKind == 0) message(kMsgInfo, 6, "Adding fake camera");
        scene.addCamera(std::make_unique<PerspectiveCamera>(
            "camera1", Mtx4::translation({0.0f, 2.0f, 10.0f}), env, 1.0471976f, 1.0471976f,
            Vec2(0.0f, 0.0f), 0, 0, 0.0f, 0.0f));
    }

    message(kMsgProgress, 6, "Loading meshes");
    for (const XMLMaterialCompact *r : materialRecords)
        scene.materials().findOrInsert(r->name, [&] { return materialConverter.convert(*r); });

    // Shapes, built in parallel; each lands in the slot of its file so that the order of the
    // shapes does not depend on which thread finished first.
    Timer meshTimer;
    meshTimer.start();
    SceneMaterialResolver resolver(scene.materials());
    std::vector<std::unique_ptr<Shape>> built(meshPaths.size());
    if (!meshPaths.empty()) {
        Timer shapeTimer;
        shapeTimer.start();
        WorkServer server(std::max(1, settings.threadCount));
        for (size_t i = 0; i < meshPaths.size(); ++i)
            server.addWork(std::make_unique<CreateTempShapeWork>(meshPaths[i], resolver,
                                                                 settings.mesh, built[i]));
        message(kMsgProgress, 6, "Progress Title: Creating Temp Shapes");
        server.waitWithProgress(0.05f, 0.1f);
        std::string why;
        if (server.failed(why)) {
            message(kMsgError, 6, "Error creating temp shapes: %s", why.c_str());
            return fail("Error creating temp shapes: " + why);
        }
        shapeTimer.stop();
        bench("Temp shape creation time: %s", shapeTimer);
    }
    message(kMsgDebug, 6, "Adding shapes to scene");
    for (auto &shape : built)
        if (shape) scene.addShape(std::move(shape));
    meshTimer.stop();
    bench("Mesh loading time: %s", meshTimer);

    // Instances.
    bool missingShape = false;
    for (const XMLInstanceCompact *r : instanceRecords) {
        const Shape *shape = scene.findShape(r->shape);
        if (!shape) {
            message(kMsgError, 6, "Instance refering to non existing shape %s", r->shape.c_str());
            missingShape = true;
            continue;
        }
        auto inst = createInstance(*r, *shape, resolver);
        if (!inst) {
            message(kMsgWarning, 6, "Failed to create instance");
            continue;
        }
        scene.addInstance(std::move(inst), linkMode(r->lightLinkMode), r->lightLinkedLights);
    }
    if (missingShape) return fail("Missing shapes");

    // Lights.
    for (const XMLLightSourceCompact *r : lightRecords) {
        bool castShadows = false;
        auto light = createLight(r->light, castShadows);
        if (!light) continue;
        if (auto *spot = dynamic_cast<SimpleSpotLight *>(light.get()))
            attachGobo(*spot, scene.textures());
        const bool environment = r->light.type == LightType::kEnvironment;
        if (environment && castShadows)
            scene.addShadowedEnvironmentLight(std::move(light), linkMode(r->lightLinkMode),
                                              r->lightLinkedInstances);
        else
            scene.addLight(std::move(light), linkMode(r->lightLinkMode), r->lightLinkedInstances);
    }
    const Color ambient = settings.environment.globalAmbientColor;
    if (luminance(ambient.r, ambient.g, ambient.b) > 0.01f)
        scene.addLight(std::make_unique<SimpleAmbientLight>("globalAmbientLight", ambient),
                       LinkMode::kNone, {});
    if (settings.environment.iblEmitLight && settings.environment.iblImageFile != "-") {
        if (auto ibl = createImageBasedLight(settings.environment, scene.textures())) {
            std::vector<std::unique_ptr<KDSpecularSubLight>> specular;
            if (ibl->emitSpecular()) specular = ibl->makeSpecularSubLights();
            scene.addLight(std::move(ibl), LinkMode::kNone, {});
            for (auto &sub : specular) scene.addGeneratedLight(std::move(sub));
        }
    }

    Timer linkTimer;
    linkTimer.start();
    scene.buildLightLinks();
    linkTimer.stop();
    bench("Light Link generation time: %s", linkTimer);

    // The ray-tracing bias.
    float bias = settings.bias;
    if (bias == 0.0f) {
        bias = automaticBias(scene.instanceBounds());
        if (!(bias > 0.0f)) {
            message(kMsgWarning, 6,
                    "The scene has no usable bounding box for an automatic bias, using %g",
                    double(kDefaultBias));
            bias = kDefaultBias;
        }
    } else if (!(bias > 0.0f) || !std::isfinite(bias)) {
        message(kMsgWarning, 6, "Invalid ray tracing bias %g, using %g", double(bias),
                double(kDefaultBias));
        bias = kDefaultBias;
    }
    scene.setBias(bias);
    message(kMsgInfo, 6, "Ray tracing bias: %f", double(bias));

    message(kMsgProgress, 6, "Successfully loaded ZPX-File");
    return true;
}

}  // namespace ox
