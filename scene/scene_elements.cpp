#include "scene/scene_elements.h"

#include <libxml/xmlreader.h>

#include "config/xml.h"
#include "core/message.h"
#include "raytrace/render_stats.h"

using ox::OXCComplexTypeInstantiator;

SceneCompactBase::~SceneCompactBase() = default;

uint32_t renderStatsFlags(const XMLRenderStatsBase &s) {
    uint32_t f = 0;
    auto bit = [&f](bool on, uint32_t b) { f |= on ? b : 0u; };
    bit(s.PrimaryVisibility, ox::kFlagPrimaryVisibility);
    bit(s.CastShadows, ox::kFlagCastShadows);
    bit(s.ReceiveShadows, ox::kFlagReceiveShadows);
    bit(s.SelfOcclusion, ox::kFlagSelfOcclusion);
    bit(s.MotionBlur, ox::kFlagMotionBlur);
    bit(s.SmoothShading, ox::kFlagSmoothShading);
    bit(s.VisibleInReflections, ox::kFlagVisibleInReflections);
    bit(s.VisibleInRefractions, ox::kFlagVisibleInRefractions);
    bit(s.VisibleInFG, ox::kFlagVisibleInFG);
    bit(s.DoubleSided, ox::kFlagDoubleSided);
    bit(s.Opposite, ox::kFlagOpposite);
    bit(s.CastGI, ox::kFlagCastGI);
    bit(s.ReceiveGI, ox::kFlagReceiveGI);
    bit(s.StaticGI, ox::kFlagStaticGI);
    bit(s.SmoothGI, ox::kFlagSmoothGI);
    bit(s.CastOcclusion, ox::kFlagCastOcclusion);
    bit(s.ReceiveOcclusion, ox::kFlagReceiveOcclusion);
    bit(s.Envelop, ox::kFlagEnvelop);
    bit(s.IsImagePlane, ox::kFlagIsImagePlane);
    bit(s.ShadowBias, ox::kFlagShadowBias);
    return f;
}

template <>
std::unique_ptr<SceneCompactBase>
XMLGenericFactory<XMLLightSourceCompact, OXCComplexTypeInstantiator<XMLLightSourceBase>>::compact(
    const ox::OXCTypeBase &object) const {
    const auto &o = static_cast<const XMLLightSourceBase &>(object);
    auto c = std::make_unique<XMLLightSourceCompact>();
    ox::LightParameters &p = c->light;
    p.name = o.Name;
    p.color = o.Color;
    p.lowerColor = o.LowerColor;
    p.type = static_cast<ox::LightType>(o.Type.value());
    p.castShadows = o.CastShadows;
    p.diffusePhotons = o.DiffusePhotons;
    p.specularPhotons = o.SpecularPhotons;
    p.photonIntensity = o.PhotonIntensity;
    p.falloffExponent = o.FalloffExponent;
    p.decayStart = o.DecayStart;
    p.decayCutoff = o.DecayCutoff;
    p.decayClampToOne = o.DecayClampToOne;
    p.directionalLightShadowAngle = o.DirectionalLightShadowAngle;
    p.pointLightShadowRadius = o.PointLightShadowRadius;
    p.spotLightConeAngle = o.SpotLightConeAngle;
    p.spotLightPenumbraAngle = o.SpotLightPenumbraAngle;
    p.spotLightPenumbraExponent = o.SpotLightPenumbraExponent;
    p.spotLightShadowRadius = o.SpotLightShadowRadius;
    p.spotLightGoboTexture = o.SpotLightGoboTexture;
    p.directLightScale = o.DirectLightScale;
    p.indirectLightScale = o.IndirectLightScale;
    for (size_t i = 0; i < o.LightRampColors.size(); ++i) {
        const XMLRampColorBase &r = o.LightRampColors[i];
        p.lightRampColors.push_back({r.r, r.g, r.b, r.pos});
    }
    p.clampToIntensity = o.ClampToIntensity;
    p.shadowSamples = o.ShadowSamples;
    p.minShadowSamples = o.MinShadowSamples;
    p.attenuationType = static_cast<ox::AttenuationType>(o.AttenuationType.value());
    p.objectToWorld = o.ObjectToWorld;
    c->lightLinkMode = o.LightLinkMode.value();
    c->lightLinkedInstances = o.LightLinkedInstances.values();
    return c;
}

template <>
std::unique_ptr<SceneCompactBase>
XMLGenericFactory<XMLCameraCompact, OXCComplexTypeInstantiator<XMLCameraBase>>::compact(
    const ox::OXCTypeBase &object) const {
    const auto &o = static_cast<const XMLCameraBase &>(object);
    auto c = std::make_unique<XMLCameraCompact>();
    c->name = o.Name;
    c->fov = o.Fov;
    c->type = o.Type.value();
    c->environmentType = o.EnvironmentType.value();
    c->imagePlaneShift = o.ImagePlaneShift;
    c->imagePlaneSize = o.ImagePlaneSize;
    c->objectToWorld = o.ObjectToWorld;
    return c;
}

namespace {

void copyBlock(const XMLTextureBlockBase &b, XMLTextureBlockCompact &c) {
    c.color = b.Color;
    c.scale = b.Scale;
    c.fileTexture = b.FileTexture;
    c.useVertexColor = b.UseVertexColor;
    c.uvLayerOverride = b.UVLayerOverride;
}

}  // namespace

template <>
std::unique_ptr<SceneCompactBase>
XMLGenericFactory<XMLMaterialCompact, OXCComplexTypeInstantiator<XMLMaterialBase>>::compact(
    const ox::OXCTypeBase &object) const {
    const auto &o = static_cast<const XMLMaterialBase &>(object);
    auto c = std::make_unique<XMLMaterialCompact>();
    c->name = o.Name;
    c->twosided = o.Twosided;
    c->primaryGIIntensity = o.PrimaryGIIntensity;
    c->primaryGISaturation = o.PrimaryGISaturation;
    c->secondaryGIIntensity = o.SecondaryGIIntensity;
    c->secondaryGISaturation = o.SecondaryGISaturation;
    c->diffuseGIBoost = o.DiffuseGIBoost;
    c->emissiveGIScale = o.EmissiveGIScale;
    c->specularGIScale = o.SpecularGIScale;
    c->diffuseAlphaAsTransparency = o.DiffuseAlphaAsTransparency;
    c->shininess = o.Shininess;
    const XMLTextureBlockBase *blocks[7] = {&o.Diffuse,  &o.Ambient,  &o.Transparency,
                                            &o.Emissive, &o.Specular, &o.Reflection,
                                            &o.Normal};
    for (int i = 0; i < 7; ++i) copyBlock(*blocks[i], c->channels[i]);
    return c;
}

template <>
std::unique_ptr<SceneCompactBase>
XMLGenericFactory<XMLInstanceCompact, OXCComplexTypeInstantiator<XMLInstanceBase>>::compact(
    const ox::OXCTypeBase &object) const {
    const auto &o = static_cast<const XMLInstanceBase &>(object);
    auto c = std::make_unique<XMLInstanceCompact>();
    c->name = o.Name;
    c->shape = o.Shape;
    c->objectToWorld = o.ObjectToWorld;
    c->lightLinkMode = o.LightLinkMode.value();
    c->lightLinkedLights = o.LightLinkedLights.values();
    c->materialOverrides = o.MaterialOverrides.values();
    c->renderStats.flags = renderStatsFlags(o.RenderStats);
    const ox::VertexBakeSamplingOptionsBase &s = o.VertexBakeSamplingOptions;
    c->vertexBakeSamplingOptions.type = s.Type.value();
    c->vertexBakeSamplingOptions.minSamples = s.MinSamples;
    c->vertexBakeSamplingOptions.maxSamples = s.MaxSamples;
    c->vertexBakeSamplingOptions.subDivStepSize = s.SubDivStepSize;
    c->vertexBakeSamplingOptions.footPrintScale = s.FootPrintScale;
    return c;
}

namespace {

using LightFactory =
    XMLGenericFactory<XMLLightSourceCompact, OXCComplexTypeInstantiator<XMLLightSourceBase>>;
using CameraFactory =
    XMLGenericFactory<XMLCameraCompact, OXCComplexTypeInstantiator<XMLCameraBase>>;
using MaterialFactory =
    XMLGenericFactory<XMLMaterialCompact, OXCComplexTypeInstantiator<XMLMaterialBase>>;
using InstanceFactory =
    XMLGenericFactory<XMLInstanceCompact, OXCComplexTypeInstantiator<XMLInstanceBase>>;

// The name of the first element of a well-formed document (empty when there is none).
std::string rootName(xmlTextReaderPtr reader) {
    std::string name;
    if (!reader) return name;
    while (xmlTextReaderRead(reader) == 1) {
        if (xmlTextReaderNodeType(reader) == XML_READER_TYPE_ELEMENT) {
            const xmlChar *n = xmlTextReaderConstLocalName(reader);
            if (n) name = reinterpret_cast<const char *>(n);
            break;
        }
    }
    xmlFreeTextReader(reader);
    return name;
}

constexpr int kReaderOptions = XML_PARSE_NONET | XML_PARSE_NOWARNING | XML_PARSE_NOERROR;

template <typename Parse, typename Root>
bool readScene(const std::string &label, std::vector<std::unique_ptr<SceneCompactBase>> &records,
               std::string &error, Parse &&parse, Root &&root) {
    static const LightFactory lightFactory;
    static const CameraFactory cameraFactory;
    static const MaterialFactory materialFactory;
    static const InstanceFactory instanceFactory;
    ox::XMLSAXDeserializer sax;
    auto bind = [&](const char *element, const XMLFactoryInterface &factory) {
        sax.addHandler(
            element, [&factory] { return factory.create(); },
            [&factory, &records](std::unique_ptr<ox::OXCTypeBase> object) {
                records.push_back(factory.compact(*object));
                return true;
            });
    };
    bind("LightSource", lightFactory);
    bind("Camera", cameraFactory);
    bind("Material", materialFactory);
    bind("Instance", instanceFactory);
    if (!parse(sax)) {
        error = "Unable to read the scene file " + label;
        return false;
    }
    std::string name = root();
    if (name != "OXScene") {
        error =
            "The scene file " + label + " has the root element \"" + name + "\" instead of OXScene";
        ox::messageText(ox::kMsgError, 6, error);
        return false;
    }
    return true;
}

}  // namespace

bool readSceneFile(const std::string &path, std::vector<std::unique_ptr<SceneCompactBase>> &records,
                   std::string &error) {
    return readScene(
        path, records, error, [&](ox::XMLSAXDeserializer &sax) { return sax.parseFile(path); },
        [&] { return rootName(xmlReaderForFile(path.c_str(), nullptr, kReaderOptions)); });
}

bool readSceneDocument(std::string_view document,
                       std::vector<std::unique_ptr<SceneCompactBase>> &records,
                       std::string &error) {
    return readScene(
        "noname.xml", records, error,
        [&](ox::XMLSAXDeserializer &sax) { return sax.parseMemory(document); },
        [&] {
            return rootName(xmlReaderForMemory(document.data(), int(document.size()), "noname.xml",
                                               nullptr, kReaderOptions));
        });
}
