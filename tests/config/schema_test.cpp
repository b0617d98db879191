#include <gtest/gtest.h>
#include <libxml/parser.h>
#include <libxml/xmlschemas.h>

#include <cstdarg>
#include <cstdio>
#include <filesystem>
#include <string>
#include <vector>

#include "config/ox_config.h"
#include "config/xml.h"
#include "tests/config/test_settings.h"
#include "tests/support/test_support.h"

using namespace cfgtest;
namespace fs = std::filesystem;

namespace {

class ConfigSchema : public oxtest::TempDirTest {
protected:
    ConfigSchema() : TempDirTest("oxschema_") {}
};

void collectError(void *context, const char *format, ...) {
    char text[1024];
    va_list args;
    va_start(args, format);
    std::vsnprintf(text, sizeof text, format, args);
    va_end(args);
    static_cast<std::string *>(context)->append(text);
}

/// The schema that thevorn -xs writes for the whole configuration, parsed by libxml2.
class WrittenSchema {
public:
    WrittenSchema() {
        ox::OXConfig config;
        oxtest::captureOutput([&] { EXPECT_TRUE(ox::writeSchema("config.xsd", config)); });
        xmlSchemaParserCtxtPtr parser = xmlSchemaNewParserCtxt("config.xsd");
        xmlSchemaSetParserErrors(parser, collectError, collectError, &errors_);
        schema_ = xmlSchemaParse(parser);
        xmlSchemaFreeParserCtxt(parser);
    }
    ~WrittenSchema() {
        if (schema_) xmlSchemaFree(schema_);
    }
    bool ok() const { return schema_ != nullptr; }
    const std::string &errors() const { return errors_; }

    /// Empty when the document validates, else libxml2's complaints.
    std::string problems(const std::string &document) const {
        xmlDocPtr doc = xmlReadMemory(document.data(), int(document.size()), "noname.xml", nullptr,
                                      XML_PARSE_NONET);
        if (!doc) return "not well-formed";
        std::string errors;
        xmlSchemaValidCtxtPtr valid = xmlSchemaNewValidCtxt(schema_);
        xmlSchemaSetValidErrors(valid, collectError, collectError, &errors);
        const int rc = xmlSchemaValidateDoc(valid, doc);
        xmlSchemaFreeValidCtxt(valid);
        xmlFreeDoc(doc);
        if (rc != 0 && errors.empty()) errors = "invalid";
        return errors;
    }

private:
    xmlSchemaPtr schema_ = nullptr;
    std::string errors_;
};

std::string config(const std::string &body) {
    return "<?xml version=\"1.0\"?>\n<OXConfig>" + body + "</OXConfig>\n";
}

/// Every configuration document shown in the README's code blocks (four-space indented).
std::vector<std::string> readmeConfigurations(const std::string &readme) {
    std::vector<std::string> found;
    std::string current;
    bool inside = false;
    size_t start = 0;
    while (start < readme.size()) {
        size_t end = readme.find('\n', start);
        if (end == std::string::npos) end = readme.size();
        std::string line = readme.substr(start, end - start);
        start = end + 1;
        if (line.rfind("    ", 0) == 0) line.erase(0, 4);
        if (!inside && line.rfind("<OXConfig>", 0) == 0) {
            inside = true;
            current.clear();
        }
        if (inside) current += line + "\n";
        if (inside && line.rfind("</OXConfig>", 0) == 0) {
            found.push_back(current);
            inside = false;
        }
    }
    return found;
}

}  // namespace

TEST_F(ConfigSchema, PartialFilesInTheWrittenOrderValidate) {
    WrittenSchema schema;
    ASSERT_TRUE(schema.ok()) << schema.errors();

    ox::OXConfig defaults;
    std::string whole;
    ASSERT_TRUE(ox::writeSettingsToString(whole, defaults));
    EXPECT_EQ(schema.problems(whole), "");

    const std::string target =
        "<BakeTextureTarget><targetSurfaces><BakeShape><target>floor</target></BakeShape>"
        "</targetSurfaces><textureName>floor</textureName></BakeTextureTarget>";
    const struct {
        const char *what;
        std::string document;
        bool valid;
    } cases[] = {
        {"an empty root", config(""), true},
        {"one settings object, one key",
         config("<FrameSettings><renderType>TextureBake"
                "</renderType></FrameSettings>"),
         true},
        {"keys in the written order",
         config("<FrameSettings><cameraName>cam</cameraName>"
                "<renderType>Render</renderType></FrameSettings>"),
         true},
        {"settings objects in the written order",
         config("<FrameSettings/><GISettings><enableGI>true</enableGI></GISettings>"), true},
        {"a bake target under its type name",
         config("<TextureBakeSettings><targets>" + target + target +
                "</targets></TextureBakeSettings>"),
         true},
        {"a string list entry",
         config("<TextureBakeSettings><RenderComponents><customPasses><element>ambientOcclusion"
                "</element></customPasses></RenderComponents></TextureBakeSettings>"),
         true},
        {"keys out of order",
         config("<FrameSettings><renderType>Render</renderType>"
                "<cameraName>cam</cameraName></FrameSettings>"),
         false},
        {"settings objects out of order", config("<GISettings/><FrameSettings/>"), false},
        {"a bake target as <element>",
         config("<TextureBakeSettings><targets><element><textureName>floor</textureName>"
                "</element></targets></TextureBakeSettings>"),
         false},
        {"a resolution without y",
         config("<FrameSettings><resolution><x>64</x></resolution></FrameSettings>"), false},
        {"an unknown enumeration name",
         config("<FrameSettings><renderType>Bake</renderType></FrameSettings>"), false},
        {"a key given twice",
         config("<FrameSettings><dither>true</dither><dither>false</dither>"
                "</FrameSettings>"),
         false},
    };
    for (const auto &c : cases)
        EXPECT_EQ(schema.problems(c.document).empty(), c.valid) << c.what << "\n"
                                                                << schema.problems(c.document);
}

TEST_F(ConfigSchema, EveryExampleConfigurationValidatesAndLoadsWithoutWarnings) {
    WrittenSchema schema;
    ASSERT_TRUE(schema.ok()) << schema.errors();
    const fs::path source = fs::path(OX_TEST_DATA_DIR).parent_path().parent_path();

    std::vector<std::pair<std::string, std::string>> documents;  // name, text
    for (const auto &entry : fs::recursive_directory_iterator(source / "examples")) {
        if (entry.path().extension() != ".xml") continue;
        const std::string text = readFile(entry.path().string());
        if (text.find("<OXConfig>") == std::string::npos) continue;  // a scene, not settings
        documents.emplace_back(entry.path().string(), text);
    }
    EXPECT_GE(documents.size(), 2u);  // the Cornell box's bake.xml and render.xml at least
    const auto shown = readmeConfigurations(readFile((source / "README.md").string()));
    EXPECT_GE(shown.size(), 1u);  // the walkthrough's bake.xml
    for (size_t i = 0; i < shown.size(); ++i)
        documents.emplace_back("README.md configuration " + std::to_string(i + 1), shown[i]);

    for (const auto &[name, text] : documents) {
        EXPECT_EQ(schema.problems(text), "") << name;
        ox::OXConfig loaded;
        const std::string printed = oxtest::captureOutput(
            [&] { EXPECT_TRUE(ox::loadSettingsFromMemory(text, loaded)) << name; });
        EXPECT_EQ(printed.find("arning"), std::string::npos) << name << "\n" << printed;
        if (text.find("<renderType>TextureBake</renderType>") != std::string::npos) {
            // A bake configuration must name what it bakes, in the spelling that loads.
            EXPECT_GT(loaded.TextureBakeSettings.targets.size(), 0u) << name;
        }
    }
}
