#include "shading/material.h"

#include <mutex>

namespace ox {

const Material *MaterialTable::find(const std::string &name) const {
    std::shared_lock lock(mutex_);
    auto it = byName_.find(name);
    return it == byName_.end() ? nullptr : it->second.get();
}

const Material *MaterialTable::findOrInsert(
    const std::string &name, const std::function<std::unique_ptr<Material>()> &make) {
    if (const Material *m = find(name)) return m;
    std::unique_lock lock(mutex_);
    // Another thread may have registered it between the two locks.
    auto it = byName_.find(name);
    if (it != byName_.end()) return it->second.get();
    std::unique_ptr<Material> made = make();
    if (!made) return nullptr;
    const Material *m = made.get();
    byName_.emplace(name, std::move(made));
    order_.push_back(m);
    return m;
}

const Material *MaterialTable::insert(std::unique_ptr<Material> material) {
    if (!material) return nullptr;
    const std::string name = material->name();
    return findOrInsert(name, [&] { return std::move(material); });
}

size_t MaterialTable::size() const {
    std::shared_lock lock(mutex_);
    return order_.size();
}

std::vector<const Material *> MaterialTable::materials() const {
    std::shared_lock lock(mutex_);
    return order_;
}

}  // namespace ox
