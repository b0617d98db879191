#pragma once

#include <memory>
#include <string>
#include <vector>

#include "config/settings_vertex.h"
#include "config/type.h"
#include "core/types.h"
#include "shading/light.h"

/// The objects of a scene document (root "OXScene"): the reflective classes the streaming reader
/// fills, one at a time, and the plain compact records the loader keeps.

/// "LightType".
enum class SceneLightType : int32_t { POINT, DIRECTIONAL, SPOT, AREA, WINDOW, ENVIRONMENT };
OX_ENUM_NAMES(SceneLightType, "LightType", "POINT", "DIRECTIONAL", "SPOT", "AREA", "WINDOW",
              "ENVIRONMENT");
/// "AttenuationType".
enum class SceneAttenuationType : int32_t { STANDARD, UNREAL };
OX_ENUM_NAMES(SceneAttenuationType, "AttenuationType", "STANDARD", "UNREAL");
/// "LightLinkMode".
enum class SceneLightLinkMode : int32_t { INCLUSIVE, EXCLUSIVE, NONE };
OX_ENUM_NAMES(SceneLightLinkMode, "LightLinkMode", "INCLUSIVE", "EXCLUSIVE", "NONE");
/// "CameraType".
enum class SceneCameraType : int32_t { PERSPECTIVE, ORTHO, ENVIRONMENT };
OX_ENUM_NAMES(SceneCameraType, "CameraType", "PERSPECTIVE", "ORTHO", "ENVIRONMENT");
/// "EnvironmentType" (projection of an environment camera).
enum class SceneEnvironmentType : int32_t { CUBEMAP, BALL, LATLONG };
OX_ENUM_NAMES(SceneEnvironmentType, "EnvironmentType", "CUBEMAP", "BALL", "LATLONG");

/// One colour of a light's ramp ("RampColor").
class XMLRampColorBase : public ox::OXCComplexType {
public:
    XMLRampColorBase() : OXCComplexType("RampColor") {}
    ox::OXCType<float> r{this, "r", 0.0f, "Red component of the ramp colour"};
    ox::OXCType<float> g{this, "g", 0.0f, "Green component of the ramp colour"};
    ox::OXCType<float> b{this, "b", 0.0f, "Blue component of the ramp colour"};
    ox::OXCType<float> pos{this, "pos", 0.0f, "Position of the colour on the ramp"};
};

/// A light of the scene ("LightSource" element, type "XMLLightSource").
class XMLLightSourceBase : public ox::OXCComplexType {
public:
    XMLLightSourceBase() : OXCComplexType("XMLLightSource") {}
    ox::OXCType<std::string> Name{this, "Name", "", "The name of the Light Source."};
    ox::OXCType<ox::Color> Color{this, "Color", ox::Color(0, 0, 0, 0),
                                 "Light colour; the upper colour of an environment light"};
    ox::OXCType<ox::Color> LowerColor{this, "LowerColor", ox::Color(0, 0, 0, 0),
                                      "Lower colour of an environment light"};
    ox::OXCEnum<SceneLightType> Type{this, "Type", SceneLightType::POINT, "Type of the light"};
    ox::OXCType<bool> CastShadows{this, "CastShadows", true, "Whether the light casts shadows"};
    ox::OXCType<int32_t> DiffusePhotons{this, "DiffusePhotons", 0,
                                        "Number of diffuse photons the light emits"};
    ox::OXCType<int32_t> SpecularPhotons{this, "SpecularPhotons", 0,
                                         "Number of specular (caustic) photons the light emits"};
    ox::OXCType<float> PhotonIntensity{this, "PhotonIntensity", 0.0f,
                                       "Intensity of the photons the light emits"};
    ox::OXCType<float> FalloffExponent{this, "FalloffExponent", 0.0f,
                                       "Exponent of the distance attenuation"};
    ox::OXCType<float> DecayStart{this, "DecayStart", 0.0f, "Distance where the decay starts"};
    ox::OXCType<float> DecayCutoff{this, "DecayCutoff", 3.4028235e38f,
                                   "Distance beyond which the light has no effect"};
    ox::OXCType<bool> DecayClampToOne{this, "DecayClampToOne", true,
                                      "Clamp the standard attenuation to at most one"};
    ox::OXCType<float> DirectionalLightShadowAngle{
        this, "DirectionalLightShadowAngle", 0.0f,
        "Shadow angle of a directional light; opening angle of a window light"};
    ox::OXCType<float> PointLightShadowRadius{this, "PointLightShadowRadius", 0.0f,
                                              "Shadow radius of a point light"};
    ox::OXCType<float> SpotLightConeAngle{this, "SpotLightConeAngle", 0.0f,
                                          "Cone angle of a spot light (degrees)"};
    ox::OXCType<float> SpotLightPenumbraAngle{this, "SpotLightPenumbraAngle", 0.0f,
                                              "Penumbra angle of a spot light (degrees)"};
    ox::OXCType<float> SpotLightPenumbraExponent{this, "SpotLightPenumbraExponent", 0.0f,
                                                 "Falloff exponent within the penumbra"};
    ox::OXCType<float> SpotLightShadowRadius{this, "SpotLightShadowRadius", 0.0f,
                                             "Shadow radius of a spot light"};
    ox::OXCType<std::string> SpotLightGoboTexture{this, "SpotLightGoboTexture", "",
                                                  "Gobo texture projected by a spot light"};
    ox::OXCType<float> DirectLightScale{this, "DirectLightScale", 1.0f,
                                        "Intensity scale for direct lighting"};
    ox::OXCType<float> IndirectLightScale{this, "IndirectLightScale", 1.0f,
                                          "Intensity scale for indirect lighting"};
    ox::OXCTypedComplexVector<XMLRampColorBase> LightRampColors{
        this, "LightRampColors", "Colour ramp of point and spot lights"};
    ox::OXCType<bool> ClampToIntensity{this, "ClampToIntensity", false,
                                       "Clamp the light of an area light to its intensity"};
    ox::OXCType<int32_t> ShadowSamples{this, "ShadowSamples", 1, "Number of shadow samples"};
    ox::OXCType<uint32_t> MinShadowSamples{this, "MinShadowSamples", 0u,
                                           "Minimum number of shadow samples"};
    ox::OXCEnum<SceneAttenuationType> AttenuationType{
        this, "AttenuationType", SceneAttenuationType::STANDARD, "Distance attenuation model"};
    ox::OXCEnum<SceneLightLinkMode> LightLinkMode{this, "LightLinkMode", SceneLightLinkMode::NONE,
                                                  "How LightLinkedInstances is used"};
    ox::OXCTypedVector<std::string> LightLinkedInstances{this, "LightLinkedInstances",
                                                         "Instances linked to this light"};
    ox::OXCType<ox::Mtx4> ObjectToWorld{this, "ObjectToWorld", ox::Mtx4(), "Light placement"};
};

/// A camera of the scene ("Camera" element, type "XMLCamera").
class XMLCameraBase : public ox::OXCComplexType {
public:
    XMLCameraBase() : OXCComplexType("XMLCamera") {}
    ox::OXCType<std::string> Name{this, "Name", "", "The name of the camera"};
    ox::OXCType<ox::Vec2> Fov{this, "Fov", ox::Vec2(1.0f, 1.0f),
                              "Horizontal and vertical field of view in radians"};
    ox::OXCEnum<SceneCameraType> Type{this, "Type", SceneCameraType::PERSPECTIVE,
                                      "Projection of the camera"};
    ox::OXCEnum<SceneEnvironmentType> EnvironmentType{this, "EnvironmentType",
                                                      SceneEnvironmentType::LATLONG,
                                                      "Projection of an environment camera"};
    ox::OXCType<ox::Vec2> ImagePlaneShift{this, "ImagePlaneShift", ox::Vec2(0.0f, 0.0f),
                                          "Shift of the image plane (perspective cameras)"};
    ox::OXCType<ox::Vec2> ImagePlaneSize{this, "ImagePlaneSize", ox::Vec2(10.0f, 10.0f),
                                         "Width and height of the view (orthographic cameras)"};
    ox::OXCType<ox::Mtx4> ObjectToWorld{this, "ObjectToWorld", ox::Mtx4(), "Camera placement"};
};

/// One channel of a material ("XMLTextureBlockBase").
class XMLTextureBlockBase : public ox::OXCComplexType {
public:
    XMLTextureBlockBase() : OXCComplexType("XMLTextureBlockBase") {}
    ox::OXCType<ox::Color> Color{this, "Color", ox::Color(0, 0, 0, 0), "Constant colour"};
    ox::OXCType<float> Scale{this, "Scale", 0.0f, "Scale of the colour"};
    ox::OXCType<std::string> FileTexture{this, "FileTexture", "", "Texture file"};
    ox::OXCType<bool> UseVertexColor{this, "UseVertexColor", false, "Use the vertex colour"};
    ox::OXCType<std::string> UVLayerOverride{this, "UVLayerOverride", "",
                                             "UV set used by the texture instead of the default"};
};

/// A material of the scene ("Material" element, type "XMLMaterial").
class XMLMaterialBase : public ox::OXCComplexType {
public:
    XMLMaterialBase() : OXCComplexType("XMLMaterial") {}
    ox::OXCType<std::string> Name{this, "Name", "", "The name of the material"};
    ox::OXCType<bool> Twosided{this, "Twosided", true, "Whether both sides are shaded"};
    ox::OXCType<float> PrimaryGIIntensity{this, "PrimaryGIIntensity", 1.0f,
                                          "Intensity of primary GI"};
    ox::OXCType<float> PrimaryGISaturation{this, "PrimaryGISaturation", 1.0f,
                                           "Saturation of primary GI"};
    ox::OXCType<float> SecondaryGIIntensity{this, "SecondaryGIIntensity", 1.0f,
                                            "Intensity of secondary GI"};
    ox::OXCType<float> SecondaryGISaturation{this, "SecondaryGISaturation", 1.0f,
                                             "Saturation of secondary GI"};
    ox::OXCType<float> DiffuseGIBoost{this, "DiffuseGIBoost", 1.0f, "Boost of diffuse GI"};
    ox::OXCType<float> EmissiveGIScale{this, "EmissiveGIScale", 1.0f, "Scale of emitted GI"};
    ox::OXCType<float> SpecularGIScale{this, "SpecularGIScale", 1.0f, "Scale of specular GI"};
    ox::OXCType<bool> DiffuseAlphaAsTransparency{this, "DiffuseAlphaAsTransparency", false,
                                                 "Use the diffuse alpha as transparency"};
    ox::OXCType<float> Shininess{this, "Shininess", 1.0f, "Specular exponent"};
    ox::OXCNested<XMLTextureBlockBase> Diffuse{this, "Diffuse", "Diffuse channel"};
    ox::OXCNested<XMLTextureBlockBase> Ambient{this, "Ambient", "Ambient channel"};
    ox::OXCNested<XMLTextureBlockBase> Transparency{this, "Transparency", "Transparency channel"};
    ox::OXCNested<XMLTextureBlockBase> Emissive{this, "Emissive", "Emissive channel"};
    ox::OXCNested<XMLTextureBlockBase> Specular{this, "Specular", "Specular channel"};
    ox::OXCNested<XMLTextureBlockBase> Reflection{this, "Reflection", "Reflection channel"};
    ox::OXCNested<XMLTextureBlockBase> Normal{this, "Normal", "Normal map channel"};
};

/// Visibility and GI flags of an instance ("RenderStats").
class XMLRenderStatsBase : public ox::OXCComplexType {
public:
    XMLRenderStatsBase() : OXCComplexType("RenderStats") {}
    ox::OXCType<bool> PrimaryVisibility{this, "PrimaryVisibility", true, "Visible to camera rays"};
    ox::OXCType<bool> CastShadows{this, "CastShadows", true, "Casts shadows"};
    ox::OXCType<bool> ReceiveShadows{this, "ReceiveShadows", true, "Receives shadows"};
    ox::OXCType<bool> SelfOcclusion{this, "SelfOcclusion", true, "Occludes itself"};
    ox::OXCType<bool> MotionBlur{this, "MotionBlur", true, "Takes part in motion blur"};
    ox::OXCType<bool> SmoothShading{this, "SmoothShading", true, "Interpolates normals"};
    ox::OXCType<bool> VisibleInReflections{this, "VisibleInReflections", true,
                                           "Visible to reflection rays"};
    ox::OXCType<bool> VisibleInRefractions{this, "VisibleInRefractions", true,
                                           "Visible to refraction rays"};
    ox::OXCType<bool> VisibleInFG{this, "VisibleInFG", true, "Visible to final gather rays"};
    ox::OXCType<bool> DoubleSided{this, "DoubleSided", true, "Both sides can be hit"};
    ox::OXCType<bool> Opposite{this, "Opposite", false, "The back side is the front"};
    ox::OXCType<bool> CastGI{this, "CastGI", true, "Casts indirect light"};
    ox::OXCType<bool> ReceiveGI{this, "ReceiveGI", true, "Receives indirect light"};
    ox::OXCType<bool> StaticGI{this, "StaticGI", false, "Indirect light is static"};
    ox::OXCType<bool> SmoothGI{this, "SmoothGI", true, "Indirect light is smoothed"};
    ox::OXCType<bool> CastOcclusion{this, "CastOcclusion", true, "Casts ambient occlusion"};
    ox::OXCType<bool> ReceiveOcclusion{this, "ReceiveOcclusion", true,
                                       "Receives ambient occlusion"};
    ox::OXCType<bool> Envelop{this, "Envelop", false, "Is an envelope"};
    ox::OXCType<bool> IsImagePlane{this, "IsImagePlane", false, "Is an image plane"};
    ox::OXCType<bool> ShadowBias{this, "ShadowBias", false, "Uses a shadow bias"};
};

/// A placement of a shape ("Instance" element, type "XMLInstance").
class XMLInstanceBase : public ox::OXCComplexType {
public:
    XMLInstanceBase() : OXCComplexType("XMLInstance") {}
    ox::OXCType<std::string> Name{this, "Name", "", "The name of the instance"};
    ox::OXCType<std::string> Shape{this, "Shape", "", "Name of the shape it shows"};
    ox::OXCType<ox::Mtx4> ObjectToWorld{this, "ObjectToWorld", ox::Mtx4(), "Shape placement"};
    ox::OXCEnum<SceneLightLinkMode> LightLinkMode{this, "LightLinkMode", SceneLightLinkMode::NONE,
                                                  "How LightLinkedLights is used"};
    ox::OXCTypedVector<std::string> LightLinkedLights{this, "LightLinkedLights",
                                                      "Lights linked to this instance"};
    ox::OXCTypedVector<std::string> MaterialOverrides{
        this, "MaterialOverrides", "Material used for the whole shape (only the first is used)"};
    ox::OXCNested<XMLRenderStatsBase> RenderStats{this, "RenderStats", "Visibility and GI flags"};
    ox::OXCNested<ox::VertexBakeSamplingOptionsBase> VertexBakeSamplingOptions{
        this, "VertexBakeSamplingOptions", "Per-instance vertex-bake sampling"};
};

/// Base of the compact records: plain copies of a scene object's members.
class SceneCompactBase {
public:
    virtual ~SceneCompactBase();
};

/// A light as the loader keeps it.
class XMLLightSourceCompact : public SceneCompactBase {
public:
    ox::LightParameters light;
    int32_t lightLinkMode = 2;
    std::vector<std::string> lightLinkedInstances;
};

/// A camera as the loader keeps it.
class XMLCameraCompact : public SceneCompactBase {
public:
    std::string name;
    ox::Vec2 fov{1.0f, 1.0f};
    int32_t type = 0;
    int32_t environmentType = 2;
    ox::Vec2 imagePlaneShift{0.0f, 0.0f};
    ox::Vec2 imagePlaneSize{10.0f, 10.0f};
    ox::Mtx4 objectToWorld;
};

/// A material channel as the loader keeps it.
class XMLTextureBlockCompact : public SceneCompactBase {
public:
    ox::Color color;
    float scale = 0.0f;
    std::string fileTexture;
    bool useVertexColor = false;
    std::string uvLayerOverride;
};

/// A material as the loader keeps it.
class XMLMaterialCompact : public SceneCompactBase {
public:
    std::string name;
    bool twosided = true;
    float primaryGIIntensity = 1.0f, primaryGISaturation = 1.0f;
    float secondaryGIIntensity = 1.0f, secondaryGISaturation = 1.0f;
    float diffuseGIBoost = 1.0f, emissiveGIScale = 1.0f, specularGIScale = 1.0f;
    bool diffuseAlphaAsTransparency = false;
    float shininess = 1.0f;
    /// Diffuse, Ambient, Transparency, Emissive, Specular, Reflection, Normal.
    XMLTextureBlockCompact channels[7];
};

/// RenderStats as the loader keeps them.
class XMLRenderStatsCompact : public SceneCompactBase {
public:
    /// The instance flag word.
    uint32_t flags = 0;
};

/// Vertex-bake sampling options as the loader keeps them.
class VertexBakeSamplingOptionsCompact : public SceneCompactBase {
public:
    int32_t type = 1;
    int32_t minSamples = 2, maxSamples = 8, subDivStepSize = 0;
    float footPrintScale = 1.0f;
};

/// An instance as the loader keeps it.
class XMLInstanceCompact : public SceneCompactBase {
public:
    std::string name;
    std::string shape;
    ox::Mtx4 objectToWorld;
    int32_t lightLinkMode = 2;
    std::vector<std::string> lightLinkedLights;
    std::vector<std::string> materialOverrides;
    XMLRenderStatsCompact renderStats;
    VertexBakeSamplingOptionsCompact vertexBakeSamplingOptions;
};

/// The flag word of a RenderStats element.
uint32_t renderStatsFlags(const XMLRenderStatsBase &stats);

/// A factory of one scene element: makes the reflective object with defaults when the element
/// opens and the compact record from the filled object when it closes.
class XMLFactoryInterface {
public:
    virtual ~XMLFactoryInterface() = default;
    /// A fresh reflective object with all defaults.
    virtual std::unique_ptr<ox::OXCTypeBase> create() const = 0;
    /// The compact record of a filled object.
    virtual std::unique_ptr<SceneCompactBase> compact(const ox::OXCTypeBase &object) const = 0;
};

/// The factory of one element: Compact is the record, Instantiator the concrete reflective class.
template <typename Compact, typename Instantiator>
class XMLGenericFactory final : public XMLFactoryInterface {
public:
    std::unique_ptr<ox::OXCTypeBase> create() const override {
        return std::make_unique<Instantiator>();
    }
    std::unique_ptr<SceneCompactBase> compact(const ox::OXCTypeBase &object) const override;
};

/// Reads one scene document, appending a compact record per scene object in reading order.
/// False (with the reason in error; the messages are already printed) when the file cannot be
/// opened or read, is not well-formed, or its root element is not "OXScene".
bool readSceneFile(const std::string &path, std::vector<std::unique_ptr<SceneCompactBase>> &records,
                   std::string &error);
/// The same for a document in memory (tests, tools).
bool readSceneDocument(std::string_view document,
                       std::vector<std::unique_ptr<SceneCompactBase>> &records, std::string &error);
