#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <shared_mutex>
#include <string>
#include <unordered_map>
#include <vector>

#include "raytrace/shape.h"
#include "shading/shader.h"

namespace ox {

/// A material of the scene: a surface shader and its photon twin, registered together under the
/// surface shader's name. Triangles and instances point at materials.
class Material final : public MaterialHandle {
public:
    Material(std::unique_ptr<SurfaceShaderInterface> surface,
             std::unique_ptr<PhotonShaderInterface> photon)
        : surface_(std::move(surface)), photon_(std::move(photon)) {}

    /// The name the material is registered under.
    const std::string &name() const { return surface_->name(); }
    /// The surface shader.
    const SurfaceShaderInterface &surface() const { return *surface_; }
    /// The photon shader (may be null).
    const PhotonShaderInterface *photon() const { return photon_.get(); }

private:
    std::unique_ptr<SurfaceShaderInterface> surface_;
    std::unique_ptr<PhotonShaderInterface> photon_;
};

/// The material behind the identity geometry holds (null stays null).
inline const Material *materialOf(const MaterialHandle *m) {
    return static_cast<const Material *>(m);
}

/// The scene's materials by name. Shapes build on several threads and register the variants
/// they need, so lookups and find-or-insert are safe to call concurrently; a registered material
/// keeps its address until the table is destroyed.
class MaterialTable {
public:
    /// The material of this name, or null.
    const Material *find(const std::string &name) const;
    /// The material of this name; if there is none, make() is called (under the table's lock,
    /// so exactly one caller makes it) and its result registered. Null when make() gives null.
    const Material *findOrInsert(const std::string &name,
                                 const std::function<std::unique_ptr<Material>()> &make);
    /// Registers a material unless its name is taken; returns the registered one either way.
    const Material *insert(std::unique_ptr<Material> material);
    /// Number of materials.
    size_t size() const;
    /// The materials in registration order (call when no thread registers any more).
    std::vector<const Material *> materials() const;

private:
    mutable std::shared_mutex mutex_;
    std::unordered_map<std::string, std::unique_ptr<Material>> byName_;
    std::vector<const Material *> order_;
};

}  // namespace ox
