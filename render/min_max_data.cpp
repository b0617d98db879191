#include "config/type.h"
#include "config/xml.h"
#include "render/post_filter.h"

/// The "MinMaxData" XML: root "MinMaxRoot" with the image-wide components ("imgMinMaxVec") and
/// one "ShapeMinMax" per instance ("minMaxVec"), each a "shape" name and its
/// "ComponentMinMaxVec" of "ComponentMinMax" (minVal, maxVal, remapped). Written and read
/// through the settings XML layer.
namespace ox {

namespace {

class ComponentMinMaxBase : public OXCComplexType {
public:
    ComponentMinMaxBase() : OXCComplexType("ComponentMinMax") {}
    OXCType<float> minVal{this, "minVal", 3.4028235e38f, "Smallest value found"};
    OXCType<float> maxVal{this, "maxVal", -3.4028235e38f, "Largest value found"};
    OXCType<bool> remapped{this, "remapped", false,
                           "True when the texels were remapped with this range"};
};

class ShapeMinMaxBase : public OXCComplexType {
public:
    ShapeMinMaxBase() : OXCComplexType("ShapeMinMax") {}
    OXCType<std::string> shape{this, "shape", "", "Name of the instance"};
    OXCTypedComplexVector<ComponentMinMaxBase> ComponentMinMaxVec{
        this, "ComponentMinMaxVec", "Ranges of the instance's components"};
};

class MinMaxRootBase : public OXCComplexType {
public:
    MinMaxRootBase() : OXCComplexType("MinMaxRoot") {}
    OXCTypedComplexVector<ComponentMinMaxBase> imgMinMaxVec{this, "imgMinMaxVec",
                                                            "Ranges over the whole image"};
    OXCTypedComplexVector<ShapeMinMaxBase> minMaxVec{this, "minMaxVec", "Ranges per instance"};
};
using MinMaxRoot = OXCComplexTypeInstantiator<MinMaxRootBase>;

void toTree(const std::vector<ComponentMinMax> &from,
            OXCTypedComplexVector<ComponentMinMaxBase> &to) {
    for (const ComponentMinMax &c : from) {
        ComponentMinMaxBase &e = to.append();
        e.minVal = c.minVal;
        e.maxVal = c.maxVal;
        e.remapped = c.remapped;
    }
}

void fromTree(const OXCTypedComplexVector<ComponentMinMaxBase> &from,
              std::vector<ComponentMinMax> &to) {
    to.clear();
    for (size_t i = 0; i < from.size(); ++i)
        to.push_back({from[i].minVal, from[i].maxVal, from[i].remapped});
}

}  // namespace

bool writeMinMaxData(const std::string &fileName, const MinMaxData &data) {
    MinMaxRoot root;
    toTree(data.image, root.imgMinMaxVec);
    for (const ShapeMinMax &s : data.shapes) {
        ShapeMinMaxBase &e = root.minMaxVec.append();
        e.shape = s.shape;
        toTree(s.components, e.ComponentMinMaxVec);
    }
    return writeSettings(fileName, root, "UTF-8");  // reports its own failure
}

bool readMinMaxData(const std::string &fileName, MinMaxData &data) {
    MinMaxRoot root;
    if (!loadSettings(fileName, root)) return false;
    MinMaxData read;
    fromTree(root.imgMinMaxVec, read.image);
    for (size_t i = 0; i < root.minMaxVec.size(); ++i) {
        ShapeMinMax s;
        s.shape = root.minMaxVec[i].shape;
        fromTree(root.minMaxVec[i].ComponentMinMaxVec, s.components);
        read.shapes.push_back(std::move(s));
    }
    data = std::move(read);
    return true;
}

}  // namespace ox
