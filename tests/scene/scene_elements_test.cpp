#include "scene/scene_elements.h"

#include <gtest/gtest.h>

#include "raytrace/render_stats.h"
#include "scene_test_util.h"

namespace ox {
namespace {

const char *kDocument = R"(<?xml version="1.0"?>
<OXScene>
  <Instance><Name>floor</Name><Shape>plane</Shape>
    <ObjectToWorld><r><c>1</c></r><r><c>0</c><c>1</c></r><r><c>0</c><c>0</c><c>1</c></r>
      <r><c>5</c><c>6</c><c>7</c><c>1</c></r></ObjectToWorld>
    <LightLinkMode>EXCLUSIVE</LightLinkMode>
    <LightLinkedLights><element>sun</element><element>lamp</element></LightLinkedLights>
    <RenderStats><CastShadows>false</CastShadows><SelfOcclusion>false</SelfOcclusion>
      <ShadowBias>true</ShadowBias></RenderStats>
    <VertexBakeSamplingOptions><Type>PerVertex</Type><MaxSamples>12</MaxSamples>
    </VertexBakeSamplingOptions></Instance>
  <LightSource><Name>lamp</Name><Type>SPOT</Type>
    <Color><r>1</r><g>0.5</g><b>0.25</b><a>1</a></Color>
    <AttenuationType>UNREAL</AttenuationType><DecayCutoff>20</DecayCutoff>
    <LightRampColors><RampColor><r>1</r><pos>0.5</pos></RampColor>
      <RampColor><g>1</g><pos>0.25</pos></RampColor></LightRampColors></LightSource>
  <Material><Name>red</Name><Shininess>20</Shininess>
    <Diffuse><Color><r>1</r><a>1</a></Color><Scale>0.8</Scale></Diffuse>
    <Normal><FileTexture>n.tga</FileTexture></Normal></Material>
  <Teapot><Name>x</Name></Teapot>
</OXScene>
)";

TEST(SceneElements, ReadsEveryKindIntoCompactRecords) {
    std::vector<std::unique_ptr<SceneCompactBase>> records;
    std::string error;
    std::string out =
        test::captureMessages([&] { ASSERT_TRUE(readSceneDocument(kDocument, records, error)); });
    EXPECT_NE(out.find("[XMLSAXParser] Unknown node: Teapot"), std::string::npos) << out;
    ASSERT_EQ(records.size(), 3u);

    auto *inst = dynamic_cast<XMLInstanceCompact *>(records[0].get());
    ASSERT_TRUE(inst);
    // Names, shapes, material overrides, light-side links and UV layer overrides are read
    // through the loader's tests.
    EXPECT_EQ(inst->objectToWorld.transformPoint({0, 0, 0}), Vec3(5, 6, 7));
    EXPECT_EQ(inst->lightLinkMode, 1);
    EXPECT_EQ(inst->lightLinkedLights, (std::vector<std::string>{"sun", "lamp"}));
    EXPECT_EQ(inst->renderStats.flags,
              (RenderStats::kDefault & ~kFlagCastShadows & ~kFlagSelfOcclusion) |
                  kFlagShadowBias);
    EXPECT_EQ(inst->vertexBakeSamplingOptions.type, 0);
    EXPECT_EQ(inst->vertexBakeSamplingOptions.maxSamples, 12);

    auto *light = dynamic_cast<XMLLightSourceCompact *>(records[1].get());
    ASSERT_TRUE(light);
    EXPECT_EQ(light->light.type, ox::LightType::kSpot);
    EXPECT_EQ(light->light.attenuationType, ox::AttenuationType::kUnreal);
    EXPECT_EQ(light->light.decayCutoff, 20.0f);
    EXPECT_EQ(light->light.color, Color(1, 0.5f, 0.25f, 1));
    ASSERT_EQ(light->light.lightRampColors.size(), 2u);
    EXPECT_EQ(light->light.lightRampColors[1].pos, 0.25f);

    // Cameras are read through the loader's tests.
    auto *mat = dynamic_cast<XMLMaterialCompact *>(records[2].get());
    ASSERT_TRUE(mat);
    EXPECT_EQ(mat->shininess, 20.0f);
    EXPECT_EQ(mat->channels[0].color, Color(1, 0, 0, 1));
    EXPECT_EQ(mat->channels[0].scale, 0.8f);
    EXPECT_EQ(mat->channels[6].fileTexture, "n.tga");
}

TEST(SceneElements, DefaultFlagWordAndBadDocuments) {
    std::vector<std::unique_ptr<SceneCompactBase>> records;
    std::string error;
    ASSERT_TRUE(readSceneDocument("<OXScene><Instance/></OXScene>", records, error));
    ASSERT_EQ(records.size(), 1u);
    EXPECT_EQ(static_cast<XMLInstanceCompact &>(*records[0]).renderStats.flags,
              RenderStats::kDefault);

    // Another root element fails the load (see the loader's tests); so do a document that is
    // not well-formed and a file that cannot be opened.
    std::string out = test::captureMessages([&] {
        EXPECT_FALSE(readSceneDocument("<OXScene><Instance></OXScene>", records, error));
        EXPECT_FALSE(readSceneFile("/no/such/scene.xml", records, error));
    });
    EXPECT_NE(out.find("[ERROR]"), std::string::npos);

    // An enumeration name in the wrong case is not a value of the enumeration.
    records.clear();
    out = test::captureMessages([&] {
        ASSERT_TRUE(readSceneDocument(
            "<OXScene><LightSource><Type>spot</Type></LightSource></OXScene>", records, error));
    });
    EXPECT_EQ(static_cast<XMLLightSourceCompact &>(*records[0]).light.type, ox::LightType::kPoint);
}

}  // namespace
}  // namespace ox
