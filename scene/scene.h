#pragma once

#include <cstdint>
#include <memory>
#include <string>
#include <unordered_map>
#include <vector>

#include "raytrace/camera.h"
#include "raytrace/instance.h"
#include "raytrace/shape.h"
#include "scene/light_links.h"
#include "shading/environment.h"
#include "shading/light.h"
#include "shading/material.h"
#include "texture/texture_factory.h"

namespace ox {

class ZPXMaterialConverter;

/// The render scene: cameras, materials, shapes, instances, lights with their light links, the
/// environment, and the ray-tracing bias. Filled by the loader, then read-only while rendering.
/// Names are unique per kind: a second object of a taken name is refused with a warning.
class Scene {
public:
    Scene();
    ~Scene();
    Scene(const Scene &) = delete;
    Scene &operator=(const Scene &) = delete;

    /// Adds a camera; false (warning) when its name is taken.
    bool addCamera(std::unique_ptr<Camera> camera);
    /// The camera of this name, or null.
    const Camera *findCamera(const std::string &name) const;
    /// The camera a run looks through: the one named by the frame setting cameraName, else the
    /// first camera (the loader adds "camera1" to a scene without one); null without cameras.
    const Camera *runCamera(const std::string &cameraName) const;
    const std::vector<std::unique_ptr<Camera>> &cameras() const { return cameras_; }

    /// The material table (safe for concurrent registration while shapes build).
    MaterialTable &materials() { return materials_; }
    const MaterialTable &materials() const { return materials_; }

    /// Adds a shape; false (warning) when its name is taken.
    bool addShape(std::unique_ptr<Shape> shape);
    /// The shape of this name, or null.
    const Shape *findShape(const std::string &name) const;
    const std::vector<std::unique_ptr<Shape>> &shapes() const { return shapes_; }

    /// Adds an instance with its light-link mode and light names; false (warning) when its name
    /// is taken.
    bool addInstance(std::unique_ptr<Instance> instance, LinkMode mode,
                     std::vector<std::string> lights);
    /// The instance of this name, or null.
    const Instance *findInstance(const std::string &name) const;
    const std::vector<std::unique_ptr<Instance>> &instances() const { return instances_; }

    /// Adds a light with its light-link mode and instance names; false (warning) when its name
    /// is taken.
    bool addLight(std::unique_ptr<LightSource> light, LinkMode mode,
                  std::vector<std::string> instances);
    /// Adds an environment light that casts shadows (the GI code samples these itself).
    bool addShadowedEnvironmentLight(std::unique_ptr<LightSource> light, LinkMode mode,
                                     std::vector<std::string> instances);
    /// Adds a light the system made itself (the image-based light's specular sub-lights, which
    /// share one name): kept apart from the named lights, so it neither takes a name nor is
    /// refused for one, and link lists cannot name it; it reaches every instance whose own link
    /// mode is NONE.
    bool addGeneratedLight(std::unique_ptr<LightSource> light);
    /// The light of this name among the lights added by name, or null.
    const LightSource *findLight(const std::string &name) const;
    const std::vector<std::unique_ptr<LightSource>> &lights() const { return lights_; }
    /// Indices (into lights()) of the environment lights that cast shadows.
    const std::vector<uint32_t> &shadowedEnvironmentLights() const { return shadowedEnv_; }

    /// Builds the light-link table from the modes and lists given when adding.
    void buildLightLinks();
    const LightLinkTable &lightLinks() const { return links_; }
    /// True when light l reaches instance i (after buildLightLinks).
    bool lightReaches(uint32_t instance, uint32_t light) const {
        return links_.reaches(instance, light);
    }

    /// World box of the instances whose flags have one of the bits of mask (all for mask 0).
    BBox instanceBounds(uint32_t mask = 0) const;

    /// The environment (shaders for rays that leave the scene).
    Environment &environment() { return environment_; }
    const Environment &environment() const { return environment_; }

    /// The texture manager of the run: material channels and the environment's probe load
    /// through it.
    TextureFactory &textures() { return textures_; }

    /// The material converter the loader made (may be null).
    void setMaterialConverter(std::unique_ptr<ZPXMaterialConverter> converter);
    const ZPXMaterialConverter *materialConverter() const { return converter_.get(); }

    /// The ray-tracing bias of the run.
    float bias() const { return bias_; }
    void setBias(float b) { bias_ = b; }

private:
    template <typename T>
    bool addNamed(std::vector<std::unique_ptr<T>> &list,
                  std::unordered_map<std::string, uint32_t> &index, std::unique_ptr<T> object,
                  const char *kind);

    std::vector<std::unique_ptr<Camera>> cameras_;
    std::unordered_map<std::string, uint32_t> cameraIndex_;
    MaterialTable materials_;
    std::vector<std::unique_ptr<Shape>> shapes_;
    std::unordered_map<std::string, uint32_t> shapeIndex_;
    std::vector<std::unique_ptr<Instance>> instances_;
    std::unordered_map<std::string, uint32_t> instanceIndex_;
    std::vector<LightLinkEntry> instanceLinks_;
    std::vector<std::unique_ptr<LightSource>> lights_;
    std::unordered_map<std::string, uint32_t> lightIndex_;
    std::vector<LightLinkEntry> lightLinks_;
    std::vector<uint32_t> shadowedEnv_;
    LightLinkTable links_;
    Environment environment_;
    TextureFactory textures_;
    std::unique_ptr<ZPXMaterialConverter> converter_;
    float bias_ = 0.005f;
};

}  // namespace ox
