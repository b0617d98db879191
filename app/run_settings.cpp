#include "app/run_settings.h"

#include "platform/file_system.h"

namespace ox {
namespace {

const char *const kRenderTypeNames[] = {"Render",          "TextureBake",    "VertexBake",
                                        "SurfaceTransfer", "VertexTransfer", "PointCloudBake"};
const char *const kImageFormatNames[] = {"TGA",    "PPM",    "EXR", "TIFF8",
                                         "TIFF16", "TIFF32", "IFF", "EXRMultiLayer"};

template <size_t N>
const char *enumName(const char *const (&names)[N], int32_t value) {
    return value >= 0 && static_cast<size_t>(value) < N ? names[value] : names[0];
}

const char *boolText(bool b) { return b ? "true" : "false"; }

}  // namespace

bool DefaultRunSettings::load(const std::string &) {
    // Without the configuration reader no file can be read.
    FileSystemUtilities::setLastError(0);
    return false;
}

bool DefaultRunSettings::writeDefault(const std::string &file) {
    const OutputVerbosityFlags &v = verbosity;
    std::string xml = "<?xml version=\"1.0\" encoding=\"ISO-8859-1\"?>\n<OXConfig>\n";
    xml += "\t<FrameSettings>\n";
    xml += "\t\t<renderType>" + std::string(enumName(kRenderTypeNames, renderTypeValue)) +
           "</renderType>\n";
    xml += "\t\t<imageFormat>" + std::string(enumName(kImageFormatNames, imageFormatValue)) +
           "</imageFormat>\n";
    xml += "\t\t<outputVerbosity>\n";
    const std::pair<const char *, bool> keys[] = {
        {"errorPrint", v.errorPrint},         {"warningPrint", v.warningPrint},
        {"benchmarkPrint", v.benchmarkPrint}, {"progressPrint", v.progressPrint},
        {"infoPrint", v.infoPrint},           {"verbosePrint", v.verbosePrint},
        {"debugPrint", v.debugPrint},         {"debugFile", v.debugFile}};
    for (const auto &k : keys)
        xml += "\t\t\t<" + std::string(k.first) + ">" + boolText(k.second) + "</" + k.first + ">\n";
    xml += "\t\t</outputVerbosity>\n";
    xml += "\t\t<autoThreads>" + std::string(boolText(autoThreadsValue)) + "</autoThreads>\n";
    xml += "\t\t<autoThreadsSubtract>" + std::to_string(autoThreadsSubtractValue) +
           "</autoThreadsSubtract>\n";
    xml += "\t\t<renderThreads>" + std::to_string(renderThreadsValue) + "</renderThreads>\n";
    xml += "\t</FrameSettings>\n</OXConfig>\n";
    return writeFileAtomically(file, xml);
}

bool DefaultRunSettings::writeSchema(const std::string &file) {
    const std::string xsd =
        "<?xml version=\"1.0\" encoding=\"ISO-8859-1\"?>\n"
        "<xsd:schema xmlns:xsd=\"http://www.w3.org/2001/XMLSchema\">\n"
        "\t<xsd:element name=\"OXConfig\">\n"
        "\t\t<xsd:complexType>\n"
        "\t\t\t<xsd:sequence>\n"
        "\t\t\t\t<xsd:any processContents=\"lax\" minOccurs=\"0\" maxOccurs=\"unbounded\"/>\n"
        "\t\t\t</xsd:sequence>\n"
        "\t\t</xsd:complexType>\n"
        "\t</xsd:element>\n"
        "</xsd:schema>\n";
    return writeFileAtomically(file, xsd);
}

std::string DefaultRunSettings::cacheFile(CacheFile which) const {
    return cacheFiles[static_cast<int>(which)];
}

void DefaultRunSettings::setCacheFile(CacheFile which, const std::string &name) {
    cacheFiles[static_cast<int>(which)] = name;
}

}  // namespace ox
