#include "config/type.h"

#include <gtest/gtest.h>

#include <type_traits>

#include "tests/config/test_settings.h"

using namespace cfgtest;

namespace {

class DuplicateBase : public ox::OXCComplexType {
public:
    DuplicateBase() : OXCComplexType("Dup") {}
    ox::OXCType<int32_t> first{this, "key", 1, "first"};
    ox::OXCType<float> second{this, "key", 2.0f, "second"};
    ox::OXCType<bool> undocumented{this, "plain", false, nullptr};
};

/// Another class with the type name of TargetBase (and one key more).
class LookAlikeTargetBase : public ox::OXCComplexType {
public:
    LookAlikeTargetBase() : OXCComplexType("Target") {}
    ox::OXCType<std::string> name{this, "name", "", "Target name"};
    ox::OXCType<int32_t> extra{this, "extra", 0, "Not in TargetBase"};
};

}  // namespace

static_assert(!std::is_copy_constructible_v<All> && !std::is_move_constructible_v<All>);
static_assert(!std::is_copy_assignable_v<All> && !std::is_move_assignable_v<All>);
static_assert(!std::is_copy_constructible_v<ox::OXCType<int32_t>>);

TEST(ConfigType, RegistryOrderLookupAndDuplicates) {
    All all;
    std::vector<std::string> keys;
    for (const auto &m : all.members()) keys.emplace_back(m.key());
    EXPECT_TRUE(std::is_sorted(keys.begin(), keys.end()));
    EXPECT_EQ(ox::findMember(all, "inner"), &all.inner);  // nested: its type name is the key
    EXPECT_EQ(ox::findMember(all, "bias"), &all.bias);
    EXPECT_EQ(ox::findMember(all, "nope"), nullptr);

    testing::internal::CaptureStdout();
    ox::OXCComplexTypeInstantiator<DuplicateBase> dup;
    std::string out = testing::internal::GetCapturedStdout();
    EXPECT_EQ(countOf(out, "Error registring variable key in container Dup, it already exists"), 1);
    EXPECT_EQ(dup.findMember("key"), &dup.first);
    EXPECT_EQ(dup.members().size(), 2u);

    out = oxtest::captureOutput([&] { EXPECT_EQ(ox::checkDocumentation(dup), 1); });
    EXPECT_EQ(countOf(out, "Attribute plain in type Dup is undocumented"), 1);
}

TEST(ConfigType, TextForms) {
    All a;
    EXPECT_EQ(a.rays.toString(), "4294967295");
    // The shortest text that reads back; 16777217 is not representable: the nearest float prints.
    for (auto [f, text] : {std::pair{0.005f, "0.005"},
                           {0.1f, "0.1"},
                           {3.4028235e38f, "3.4028235e+38"},
                           {16777217.0f, "16777216"}}) {
        a.bias = f;
        EXPECT_EQ(a.bias.toString(), text);
    }
    EXPECT_EQ(a.tint.toString(), "(1.0000, 0.5000, 0.2500)");
    EXPECT_EQ(a.resolution.toString(), "(640, 480)");
    EXPECT_EQ(a.filter.toString(), "(1, 1)");
    EXPECT_EQ(a.up.toString(), "(0, 1, 0)");
    EXPECT_EQ(a.placement.toString(), "(1, 0, 0, 0)\n(0, 1, 0, 0)\n(0, 0, 1, 0)\n(0, 0, 0, 1)\n");
    for (const char *f : {"a", "b"}) a.files.push(f);
    EXPECT_EQ(a.files.toString(), "a\nb\n");
}

TEST(ConfigType, EnumerationsAreKeyedByTheirType) {
    All a;
    EXPECT_TRUE(a.mode.setFromString("TextureBake"));
    EXPECT_EQ(a.mode.get(), Mode::TextureBake);
    EXPECT_FALSE(a.mode.setFromString("texturebake"));  // exact table
    EXPECT_EQ(a.mode.get(), Mode::TextureBake);
    EXPECT_TRUE(a.folded.setFromString("bEtA"));  // folding table
    EXPECT_EQ(a.folded.get(), Folded::Beta);
    EXPECT_EQ(a.folded.toString(), "Beta");  // names keep their declared spelling

    EXPECT_EQ(a.sampling.value(), 1);
    a.sampling.setValue(0);  // no name has 0
    EXPECT_EQ(a.sampling.toString(), "");
    EXPECT_FALSE(a.sampling.setFromString(""));

    // Two enumerations named "EnvironmentType" are different tables.
    const ox::OXCEnumTable &ta = ox::enumTable<EnvA>();
    const ox::OXCEnumTable &tb = ox::enumTable<EnvB>();
    EXPECT_NE(&ta, &tb);
    EXPECT_EQ(ta.typeName(), tb.typeName());
    EXPECT_EQ(ta.find("Camera"), 1);
    EXPECT_EQ(tb.find("Camera"), -1);
    EXPECT_EQ(tb.find("LATLONG"), 2);

    ox::OXCEnum<EnvB> camEnv("env", EnvB::Latlong);
    // Same member name, another table: refused.
    EXPECT_EQ(countOf(oxtest::captureOutput([&] { ox::assign(a.inner.env, camEnv); }),
                      "Type error when assigning variable env"),
              1);
    EXPECT_EQ(a.inner.env.get(), EnvA::Camera);
    ox::OXCEnum<EnvA> other("somethingElse", EnvA::SkyLight);
    ox::assign(a.inner.env, other);  // same table: copied whatever the name
    EXPECT_EQ(a.inner.env.get(), EnvA::SkyLight);
}

TEST(ConfigType, AssignmentByName) {
    All target;
    All source;
    source.count = 7;
    source.camera = "cam2";
    source.inner.gamma = 2.2f;
    source.placement.ref().m[3][0] = 5.0f;
    for (const char *f : {"x", "y", "z"}) source.files.push(f);
    for (const char *f : {"keep1", "keep2"}) target.files.push(f);
    source.targets.append().name = "t1";
    ox::assign(target, source);
    EXPECT_EQ(target.count.get(), 7);
    EXPECT_EQ(target.camera.get(), "cam2");
    EXPECT_FLOAT_EQ(target.inner.gamma.get(), 2.2f);
    EXPECT_EQ(target.placement.get().m[3][0], 5.0f);
    // Vector entries are appended after the entries the target had.
    EXPECT_EQ(target.files.values(), (std::vector<std::string>{"keep1", "keep2", "x", "y", "z"}));
    ASSERT_EQ(target.targets.size(), 1u);
    EXPECT_EQ(target.targets[0].name.get(), "t1");

    // A scalar of another type warns and keeps the target.
    ox::OXCType<int32_t> intSource("bias", 3);
    EXPECT_EQ(countOf(oxtest::captureOutput([&] { ox::assign(target.bias, intSource); }),
                      "Type error when assigning variable bias"),
              1);
    EXPECT_FLOAT_EQ(target.bias.get(), 0.005f);

    // Vector entries must have the target's element type.
    ox::OXCTypedVector<std::string> strings("targets");
    strings.push("not a target");
    EXPECT_EQ(countOf(oxtest::captureOutput([&] { ox::assign(target.targets, strings); }),
                      "Type error when assigning variable targets"),
              1);
    EXPECT_EQ(target.targets.size(), 1u);
    ox::OXCType<int32_t> wrongEntry("element", 1);
    EXPECT_EQ(countOf(oxtest::captureOutput([&] { EXPECT_FALSE(target.files.add(wrongEntry)); }),
                      "Type error"),
              1);
    // Members the target lacks: see VectorEntriesAlwaysHaveTheElementClass.
}

TEST(ConfigType, CloneIsDeepAndIndependent) {
    All a;
    a.count = 11;
    a.inner.gamma = 0.45f;
    a.files.push("f");
    a.targets.append().size = ox::Vec2i(64, 32);
    std::unique_ptr<ox::OXCTypeBase> c = a.clone();
    EXPECT_EQ(xmlOf(*c), xmlOf(a));
    auto &copy = static_cast<All &>(*c);
    copy.targets[0].size = ox::Vec2i(1, 1);
    copy.files.push("g");
    EXPECT_EQ(a.targets[0].size.get(), ox::Vec2i(64, 32));
    EXPECT_EQ(a.files.size(), 1u);
    // A clone of a nested member is a free-standing object of the same class.
    std::unique_ptr<ox::OXCTypeBase> inner = a.inner.clone();
    EXPECT_EQ(inner->name(), "inner");
    EXPECT_FLOAT_EQ(static_cast<InnerBase &>(*inner).gamma.get(), 0.45f);
    // A clone of a vector clones its entries and keeps its prototype.
    std::unique_ptr<ox::OXCTypeBase> vec = a.targets.clone();
    EXPECT_TRUE(ox::sameType(*vec, a.targets));
    EXPECT_EQ(static_cast<ox::OXCTypeVector &>(*vec).size(), 1u);
}

TEST(ConfigType, VectorEntriesAlwaysHaveTheElementClass) {
    // Entries of another C++ class with the same type name are converted, never stored as they
    // are: the typed accessors must see a TargetBase.
    ox::OXCTypeVector lookAlikes(
        "targets", std::make_unique<ox::OXCComplexTypeInstantiator<LookAlikeTargetBase>>());
    ox::OXCComplexTypeInstantiator<LookAlikeTargetBase> one;
    one.name = "converted";
    one.extra = 5;
    ASSERT_TRUE(lookAlikes.add(one));
    All all;
    EXPECT_EQ(countOf(oxtest::captureOutput([&] { ox::assign(all.targets, lookAlikes); }),
                      "Unknown target for assignment extra in complex type Target"),
              1);
    ASSERT_EQ(all.targets.size(), 1u);
    EXPECT_EQ(all.targets[0].name.get(), "converted");
    EXPECT_NE(dynamic_cast<TargetBase *>(&all.targets.element(0)), nullptr);

    oxtest::captureOutput([&] { EXPECT_TRUE(all.targets.append(one.clone())); });
    EXPECT_NE(dynamic_cast<TargetBase *>(&all.targets.element(1)), nullptr);
    EXPECT_EQ(all.targets[1].name.get(), "converted");

    // Scalar entries take the prototype's name.
    ox::OXCType<std::string> named("whatever", "v");
    ASSERT_TRUE(all.files.add(named));
    EXPECT_EQ(all.files.element(0).name(), "element");
}
