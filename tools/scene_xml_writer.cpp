#include "tools/scene_xml_writer.h"

#include <libxml/xmlwriter.h>

#include "config/value_text.h"
#include "core/message.h"
#include "platform/file_system.h"

namespace ox {

namespace {

// The element forms of the settings writer: numbers as the shortest text that reads back the
// same float, colours as r g b a, matrices as four "r" rows of four "c", string lists as
// "element" entries.
class SceneWriter {
public:
    explicit SceneWriter(xmlTextWriterPtr w) : w_(w) {}
    bool ok() const { return ok_; }

    void begin(const char *name) { check(xmlTextWriterStartElement(w_, bx(name))); }
    void end() { check(xmlTextWriterEndElement(w_)); }
    void text(const char *name, const std::string &value) {
        check(xmlTextWriterWriteElement(w_, bx(name), bx(value.c_str())));
    }
    void number(const char *name, double value) {
        std::string s;
        appendFloatText(float(value), s);
        text(name, s);
    }
    void integer(const char *name, long long value) { text(name, std::to_string(value)); }
    void boolean(const char *name, bool value) { text(name, value ? "true" : "false"); }
    void color(const char *name, const Color &c) {
        begin(name);
        number("r", c.r), number("g", c.g), number("b", c.b), number("a", c.a);
        end();
    }
    void vec2(const char *name, const Vec2 &v) {
        begin(name);
        number("x", v.x), number("y", v.y);
        end();
    }
    void matrix(const char *name, const Mtx4 &m) {
        begin(name);
        for (int i = 0; i < 4; ++i) {
            begin("r");
            for (int j = 0; j < 4; ++j) number("c", m.m[i][j]);
            end();
        }
        end();
    }
    void emptyList(const char *name) {
        begin(name);
        end();
    }

private:
    static const xmlChar *bx(const char *s) { return reinterpret_cast<const xmlChar *>(s); }
    void check(int rc) {
        if (rc < 0) ok_ = false;
    }
    xmlTextWriterPtr w_;
    bool ok_ = true;
};

const char *kLightTypes[] = {"POINT", "DIRECTIONAL", "SPOT", "AREA", "WINDOW", "ENVIRONMENT"};
const char *kCameraTypes[] = {"PERSPECTIVE", "ORTHO", "ENVIRONMENT"};

void writeChannel(SceneWriter &w, const char *name, const ImportedChannel &c) {
    w.begin(name);
    w.color("Color", c.color);
    w.number("Scale", c.scale);
    w.text("FileTexture", c.fileTexture);
    w.boolean("UseVertexColor", c.useVertexColor);
    w.text("UVLayerOverride", c.uvLayerOverride);
    w.end();
}

void writeMaterial(SceneWriter &w, const ImportedMaterial &m) {
    w.begin("Material");
    w.text("Name", m.name);
    w.boolean("Twosided", m.twosided);
    for (const char *key :
         {"PrimaryGIIntensity", "PrimaryGISaturation", "SecondaryGIIntensity",
          "SecondaryGISaturation", "DiffuseGIBoost", "EmissiveGIScale", "SpecularGIScale"})
        w.number(key, 1.0);
    w.boolean("DiffuseAlphaAsTransparency", false);
    w.number("Shininess", m.shininess);
    writeChannel(w, "Diffuse", m.diffuse);
    writeChannel(w, "Ambient", m.ambient);
    writeChannel(w, "Transparency", m.transparency);
    writeChannel(w, "Emissive", m.emissive);
    writeChannel(w, "Specular", m.specular);
    writeChannel(w, "Reflection", m.reflection);
    writeChannel(w, "Normal", m.normal);
    w.end();
}

void writeInstance(SceneWriter &w, const ImportedInstance &in) {
    w.begin("Instance");
    w.text("Name", in.name);
    w.text("Shape", in.shape);
    w.matrix("ObjectToWorld", in.objectToWorld);
    w.text("LightLinkMode", "NONE");
    w.emptyList("LightLinkedLights");
    w.emptyList("MaterialOverrides");
    w.begin("RenderStats");
    const std::pair<const char *, bool> stats[] = {{"PrimaryVisibility", true},
                                                   {"CastShadows", true},
                                                   {"ReceiveShadows", true},
                                                   {"SelfOcclusion", true},
                                                   {"MotionBlur", true},
                                                   {"SmoothShading", true},
                                                   {"VisibleInReflections", true},
                                                   {"VisibleInRefractions", true},
                                                   {"VisibleInFG", true},
                                                   {"DoubleSided", true},
                                                   {"Opposite", false},
                                                   {"CastGI", true},
                                                   {"ReceiveGI", true},
                                                   {"StaticGI", false},
                                                   {"SmoothGI", true},
                                                   {"CastOcclusion", true},
                                                   {"ReceiveOcclusion", true},
                                                   {"Envelop", false},
                                                   {"IsImagePlane", false},
                                                   {"ShadowBias", false}};
    for (const auto &[key, value] : stats) w.boolean(key, value);
    w.end();
    w.begin("VertexBakeSamplingOptions");
    w.text("Type", "TriangleSubdiv");
    w.integer("MinSamples", 2);
    w.integer("MaxSamples", 8);
    w.integer("SubDivStepSize", 0);
    w.number("FootPrintScale", 1.0);
    w.end();
    w.end();
}

void writeCamera(SceneWriter &w, const ImportedCamera &c) {
    w.begin("Camera");
    w.text("Name", c.name);
    w.vec2("Fov", c.fov);
    w.text("Type", kCameraTypes[int(c.type)]);
    w.text("EnvironmentType", "LATLONG");
    w.vec2("ImagePlaneShift", Vec2());
    w.vec2("ImagePlaneSize", c.imagePlaneSize);
    w.matrix("ObjectToWorld", c.objectToWorld);
    w.end();
}

void writeLight(SceneWriter &w, const ImportedLight &l) {
    const bool environment = l.type == ImportedLightType::kEnvironment;
    w.begin("LightSource");
    w.text("Name", l.name);
    w.color("Color", l.color);
    w.color("LowerColor", environment ? l.color : Color());
    w.text("Type", kLightTypes[int(l.type)]);
    w.boolean("CastShadows", !environment);
    w.integer("DiffusePhotons", 0);
    w.integer("SpecularPhotons", 0);
    w.number("PhotonIntensity", 0.0);
    w.number("FalloffExponent", l.falloffExponent);
    w.number("DecayStart", 0.0);
    w.number("DecayCutoff", 3.4028235e38);
    w.boolean("DecayClampToOne", true);
    w.number("DirectionalLightShadowAngle", 0.0);
    w.number("PointLightShadowRadius", 0.0);
    w.number("SpotLightConeAngle", l.coneAngleDegrees);
    w.number("SpotLightPenumbraAngle", l.penumbraAngleDegrees);
    w.number("SpotLightPenumbraExponent", 0.0);
    w.number("SpotLightShadowRadius", 0.0);
    w.text("SpotLightGoboTexture", "");
    w.number("DirectLightScale", 1.0);
    w.number("IndirectLightScale", 1.0);
    w.emptyList("LightRampColors");
    w.boolean("ClampToIntensity", false);
    w.integer("ShadowSamples", l.type == ImportedLightType::kArea ? 16 : 1);
    w.integer("MinShadowSamples", 0);
    w.text("AttenuationType", "STANDARD");
    w.text("LightLinkMode", "NONE");
    w.emptyList("LightLinkedInstances");
    w.matrix("ObjectToWorld", l.objectToWorld);
    w.end();
}

}  // namespace

bool writeSceneXml(const std::string &path, const ImportedModel &model) {
    AtomicFile out(path);
    const std::string &temp = out.tempPath();
    xmlTextWriterPtr writer = temp.empty() ? nullptr : xmlNewTextWriterFilename(temp.c_str(), 0);
    if (!writer) {
        message(kMsgError, 6, "Error creating xml writer for %s", path.c_str());
        return false;
    }
    bool ok = xmlTextWriterStartDocument(writer, nullptr, "ISO-8859-1", nullptr) >= 0;
    ok = ok && xmlTextWriterSetIndent(writer, 1) >= 0;
    ok = ok && xmlTextWriterSetIndentString(writer, reinterpret_cast<const xmlChar *>("\t")) >= 0;
    SceneWriter w(writer);
    if (ok) {
        w.begin("OXScene");
        for (const ImportedMaterial &m : model.materials) writeMaterial(w, m);
        for (const ImportedInstance &i : model.instances) writeInstance(w, i);
        for (const ImportedCamera &c : model.cameras) writeCamera(w, c);
        for (const ImportedLight &l : model.lights) writeLight(w, l);
        w.end();
        ok = w.ok() && xmlTextWriterEndDocument(writer) >= 0;
    }
    xmlFreeTextWriter(writer);
    if (!ok || !out.commit()) {
        message(kMsgError, 6, "Error writing scene file %s", path.c_str());
        return false;
    }
    return true;
}

}  // namespace ox
