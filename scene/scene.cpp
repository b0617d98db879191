#include "scene/scene.h"

#include "core/message.h"
#include "scene/material_converter.h"

namespace ox {

Scene::Scene() = default;
Scene::~Scene() = default;

template <typename T>
bool Scene::addNamed(std::vector<std::unique_ptr<T>> &list,
                     std::unordered_map<std::string, uint32_t> &index, std::unique_ptr<T> object,
                     const char *kind) {
    if (!object) return false;
    auto [it, added] = index.try_emplace(object->name(), static_cast<uint32_t>(list.size()));
    if (!added) {
        message(kMsgWarning, 6, "Duplicate %s name %s, keeping the first one", kind,
                object->name().c_str());
        return false;
    }
    list.push_back(std::move(object));
    return true;
}

bool Scene::addCamera(std::unique_ptr<Camera> camera) {
    return addNamed(cameras_, cameraIndex_, std::move(camera), "camera");
}

const Camera *Scene::findCamera(const std::string &name) const {
    auto it = cameraIndex_.find(name);
    return it == cameraIndex_.end() ? nullptr : cameras_[it->second].get();
}

const Camera *Scene::runCamera(const std::string &cameraName) const {
    if (const Camera *named = findCamera(cameraName)) return named;
    return cameras_.empty() ? nullptr : cameras_.front().get();
}

bool Scene::addShape(std::unique_ptr<Shape> shape) {
    return addNamed(shapes_, shapeIndex_, std::move(shape), "shape");
}

const Shape *Scene::findShape(const std::string &name) const {
    auto it = shapeIndex_.find(name);
    return it == shapeIndex_.end() ? nullptr : shapes_[it->second].get();
}

bool Scene::addInstance(std::unique_ptr<Instance> instance, LinkMode mode,
                        std::vector<std::string> lights) {
    if (!instance) return false;
    std::string name = instance->name();
    if (!addNamed(instances_, instanceIndex_, std::move(instance), "instance")) return false;
    instanceLinks_.push_back({std::move(name), mode, std::move(lights)});
    return true;
}

const Instance *Scene::findInstance(const std::string &name) const {
    auto it = instanceIndex_.find(name);
    return it == instanceIndex_.end() ? nullptr : instances_[it->second].get();
}

bool Scene::addLight(std::unique_ptr<LightSource> light, LinkMode mode,
                     std::vector<std::string> instances) {
    if (!light) return false;
    std::string name = light->name();
    if (!addNamed(lights_, lightIndex_, std::move(light), "light")) return false;
    lightLinks_.push_back({std::move(name), mode, std::move(instances)});
    return true;
}

bool Scene::addShadowedEnvironmentLight(std::unique_ptr<LightSource> light, LinkMode mode,
                                        std::vector<std::string> instances) {
    const uint32_t index = static_cast<uint32_t>(lights_.size());
    if (!addLight(std::move(light), mode, std::move(instances))) return false;
    shadowedEnv_.push_back(index);
    return true;
}

bool Scene::addGeneratedLight(std::unique_ptr<LightSource> light) {
    if (!light) return false;
    LightLinkEntry entry{light->name(), LinkMode::kNone, {}};
    entry.named = false;
    lights_.push_back(std::move(light));
    lightLinks_.push_back(std::move(entry));
    return true;
}

const LightSource *Scene::findLight(const std::string &name) const {
    auto it = lightIndex_.find(name);
    return it == lightIndex_.end() ? nullptr : lights_[it->second].get();
}

void Scene::buildLightLinks() { links_.build(instanceLinks_, lightLinks_); }

BBox Scene::instanceBounds(uint32_t mask) const {
    BBox box;
    for (const auto &inst : instances_)
        if (mask == 0 || (inst->flags() & mask) != 0) box.extend(inst->worldBounds());
    return box;
}

void Scene::setMaterialConverter(std::unique_ptr<ZPXMaterialConverter> converter) {
    converter_ = std::move(converter);
}

}  // namespace ox
