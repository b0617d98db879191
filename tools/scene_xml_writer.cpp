#include "tools/scene_xml_writer.h"

#include <cerrno>
#include <cstring>

#include "config/type.h"
#include "config/xml.h"
#include "core/message.h"
#include "platform/file_system.h"
#include "scene/scene_elements.h"

namespace ox {

namespace {

// A scene object under its element name inside an "OXScene" root, so that the settings writer
// writes it exactly as a scene document holds it.
template <typename Element, const char *kKey>
class SceneObjectDocBase : public OXCComplexType {
public:
    SceneObjectDocBase() : OXCComplexType("OXScene") {}
    OXCNested<Element> object{this, kKey, "The scene object"};
};

inline constexpr char kMaterialKey[] = "Material";
inline constexpr char kInstanceKey[] = "Instance";
inline constexpr char kCameraKey[] = "Camera";
inline constexpr char kLightKey[] = "LightSource";

template <typename Element, const char *kKey>
using SceneObjectDoc = OXCComplexTypeInstantiator<SceneObjectDocBase<Element, kKey>>;

// Appends the object's element (without the document's declaration and root) to out.
bool appendObject(const OXCTypeBase &doc, std::string &out) {
    std::string text;
    if (!writeSettingsToString(text, doc)) return false;
    const std::string open = "<OXScene>\n", close = "</OXScene>";
    size_t begin = text.find(open), end = text.rfind(close);
    if (begin == std::string::npos || end == std::string::npos || end < begin) return false;
    begin += open.size();
    out.append(text, begin, end - begin);
    return true;
}

void fillChannel(XMLTextureBlockBase &block, const ImportedChannel &c) {
    block.Color = c.color;
    block.Scale = c.scale;
    block.FileTexture = c.fileTexture;
    block.UseVertexColor = c.useVertexColor;
    block.UVLayerOverride = c.uvLayerOverride;
}

bool appendMaterial(const ImportedMaterial &m, std::string &out) {
    SceneObjectDoc<XMLMaterialBase, kMaterialKey> doc;
    XMLMaterialBase &x = doc.object;
    x.Name = m.name;
    x.Twosided = m.twosided;
    x.DiffuseAlphaAsTransparency = m.diffuseAlphaAsTransparency;
    x.Shininess = m.shininess;
    fillChannel(x.Diffuse, m.diffuse);
    fillChannel(x.Ambient, m.ambient);
    fillChannel(x.Transparency, m.transparency);
    fillChannel(x.Emissive, m.emissive);
    fillChannel(x.Specular, m.specular);
    fillChannel(x.Reflection, m.reflection);
    fillChannel(x.Normal, m.normal);
    return appendObject(doc, out);
}

bool appendInstance(const ImportedInstance &in, std::string &out) {
    SceneObjectDoc<XMLInstanceBase, kInstanceKey> doc;
    XMLInstanceBase &x = doc.object;
    x.Name = in.name;
    x.Shape = in.shape;
    x.ObjectToWorld = in.objectToWorld;
    return appendObject(doc, out);
}

bool appendCamera(const ImportedCamera &c, std::string &out) {
    SceneObjectDoc<XMLCameraBase, kCameraKey> doc;
    XMLCameraBase &x = doc.object;
    x.Name = c.name;
    x.Fov = c.fov;
    x.Type = static_cast<SceneCameraType>(c.type);
    x.ImagePlaneSize = c.imagePlaneSize;
    x.ObjectToWorld = c.objectToWorld;
    return appendObject(doc, out);
}

bool appendLight(const ImportedLight &l, std::string &out) {
    SceneObjectDoc<XMLLightSourceBase, kLightKey> doc;
    XMLLightSourceBase &x = doc.object;
    const bool environment = l.type == ImportedLightType::kEnvironment;
    x.Name = l.name;
    x.Color = l.color;
    if (environment) x.LowerColor = l.color;
    x.Type = static_cast<SceneLightType>(l.type);
    // An ambient light from a model file lights evenly; it has no shadows to cast.
    x.CastShadows = !environment;
    x.FalloffExponent = l.falloffExponent;
    x.SpotLightConeAngle = l.coneAngleDegrees;
    x.SpotLightPenumbraAngle = l.penumbraAngleDegrees;
    if (l.type == ImportedLightType::kArea) x.ShadowSamples = 16;
    x.ObjectToWorld = l.objectToWorld;
    return appendObject(doc, out);
}

}  // namespace

bool writeSceneXml(const std::string &path, const ImportedModel &model) {
    std::string text = "<?xml version=\"1.0\" encoding=\"ISO-8859-1\"?>\n<OXScene>\n";
    bool ok = true;
    for (const ImportedMaterial &m : model.materials) ok = ok && appendMaterial(m, text);
    for (const ImportedInstance &i : model.instances) ok = ok && appendInstance(i, text);
    for (const ImportedCamera &c : model.cameras) ok = ok && appendCamera(c, text);
    for (const ImportedLight &l : model.lights) ok = ok && appendLight(l, text);
    text += "</OXScene>\n";
    if (!ok) {
        message(kMsgError, 6, "Error creating xml writer for %s", path.c_str());
        return false;
    }
    if (!writeFileAtomically(path, text)) {
        message(kMsgError, 6, "Error writing scene file %s: %s", path.c_str(),
                std::strerror(FileSystemUtilities::lastError()));
        return false;
    }
    return true;
}

}  // namespace ox
