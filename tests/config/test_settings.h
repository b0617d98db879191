#pragma once

#include <gtest/gtest.h>

#include <string>

#include "config/type.h"
#include "config/xml.h"
#include "tests/support/test_support.h"

// Settings classes and helpers shared by the configuration tests: every value type, a nested
// object, both vector kinds, two enumerations that share a type name.
namespace cfgtest {

using oxtest::countOf;
using oxtest::readFile;
using oxtest::writeFile;

/// The tree as the writer puts it in a file.
inline std::string xmlOf(const ox::OXCTypeBase &v) {
    std::string s;
    EXPECT_TRUE(ox::writeSettingsToString(s, v));
    return s;
}

/// A document whose entity a29 expands to 10^29 copies of "lol" (besides any `extraDecl`).
inline std::string billionLaughs(const std::string &root, const std::string &extraDecl,
                                 const std::string &body) {
    std::string doc =
        "<?xml version=\"1.0\"?><!DOCTYPE " + root + " [<!ENTITY a0 \"lol\">" + extraDecl;
    for (int i = 1; i < 30; ++i) {
        std::string text;
        for (int k = 0; k < 10; ++k) text += "&a" + std::to_string(i - 1) + ";";
        doc += "<!ENTITY a" + std::to_string(i) + " \"" + text + "\">";
    }
    return doc + "]>" + body;
}

enum class Mode : int32_t { Render, TextureBake, VertexBake };
OX_ENUM_NAMES(Mode, "RenderType", "Render", "TextureBake", "VertexBake");

enum class Sampling : int32_t { Adaptive = 1, SuperSampling = 2 };
OX_ENUM_VALUES(Sampling, "SamplingType", {"Adaptive", 1}, {"SuperSampling", 2});

enum class Folded : int32_t { Alpha, Beta };
OX_ENUM_NAMES_FOLD(Folded, "FoldedType", "Alpha", "Beta");

enum class EnvA : int32_t { None, Camera, SkyLight };
OX_ENUM_NAMES(EnvA, "EnvironmentType", "None", "Camera", "SkyLight");
enum class EnvB : int32_t { Cubemap, Ball, Latlong };
OX_ENUM_NAMES(EnvB, "EnvironmentType", "CUBEMAP", "BALL", "LATLONG");

class InnerBase : public ox::OXCComplexType {
public:
    InnerBase() : OXCComplexType("inner") {}
    ox::OXCType<float> gamma{this, "gamma", 1.0f, "Output gamma"};
    ox::OXCEnum<EnvA> env{this, "env", EnvA::Camera, "Environment"};
};

class TargetBase : public ox::OXCComplexType {
public:
    TargetBase() : OXCComplexType("Target") {}
    ox::OXCType<std::string> name{this, "name", "", "Target name"};
    ox::OXCType<ox::Vec2i> size{this, "size", {0, 0}, "Target size"};
};

class AllBase : public ox::OXCComplexType {
public:
    AllBase() : OXCComplexType("All") {}
    ox::OXCType<bool> flag{this, "flag", true, "A bool"};
    ox::OXCType<int32_t> count{this, "count", -2, "An int"};
    ox::OXCType<uint32_t> rays{this, "rays", 4294967295u, "An unsigned"};
    ox::OXCType<float> bias{this, "bias", 0.005f, "A float"};
    ox::OXCType<std::string> camera{this, "camera", "persp", "A string"};
    ox::OXCType<ox::Color> ambient{this, "ambient", {0, 0, 0, 0}, "A colour"};
    ox::OXCType<ox::RGBf> tint{this, "tint", {1, 0.5f, 0.25f}, "An RGB"};
    ox::OXCType<ox::Vec2i> resolution{this, "resolution", {640, 480}, "A Vec2i"};
    ox::OXCType<ox::Vec2> filter{this, "filter", {1, 1}, "A Vec2"};
    ox::OXCType<ox::Vec3> up{this, "up", {0, 1, 0}, "A Vec3"};
    ox::OXCType<ox::Mtx4> placement{this, "placement", ox::Mtx4::identity(), "A matrix"};
    ox::OXCEnum<Mode> mode{this, "mode", Mode::Render, "An enum"};
    ox::OXCEnum<Sampling> sampling{this, "sampling", Sampling::Adaptive, "Explicit values"};
    ox::OXCEnum<Folded> folded{this, "folded", Folded::Alpha, "Case-folded enum"};
    ox::OXCNested<InnerBase> inner{this, "", "Nested settings"};
    ox::OXCTypedVector<std::string> files{this, "files", "A string vector"};
    ox::OXCTypedComplexVector<TargetBase> targets{this, "targets", "An object vector"};
};

using All = ox::OXCComplexTypeInstantiator<AllBase>;

class RootBase : public ox::OXCComplexType {
public:
    RootBase() : OXCComplexType("OXConfig") {}
    ox::OXCNested<AllBase> all{this, "", "Everything"};
};
using Root = ox::OXCComplexTypeInstantiator<RootBase>;

}  // namespace cfgtest
