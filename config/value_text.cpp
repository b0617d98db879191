#include "config/value_text.h"

#include <charconv>
#include <cmath>

namespace ox {

namespace {

bool isXmlSpace(char c) { return c == ' ' || c == '\t' || c == '\n' || c == '\r'; }

}  // namespace

std::string_view trimXmlSpace(std::string_view text) {
    size_t b = 0, e = text.size();
    while (b < e && isXmlSpace(text[b])) ++b;
    while (e > b && isXmlSpace(text[e - 1])) --e;
    return text.substr(b, e - b);
}

bool parseInt32(std::string_view text, int32_t &out) {
    if (!text.empty() && text[0] == '+') text.remove_prefix(1);
    if (text.empty() || text[0] == '+') return false;
    int32_t v = 0;
    auto r = std::from_chars(text.data(), text.data() + text.size(), v);
    if (r.ec != std::errc() || r.ptr != text.data() + text.size()) return false;
    out = v;
    return true;
}

bool parseUInt32(std::string_view text, uint32_t &out) {
    if (!text.empty() && text[0] == '+') text.remove_prefix(1);
    if (text.empty() || text[0] == '+' || text[0] == '-') return false;
    uint32_t v = 0;
    auto r = std::from_chars(text.data(), text.data() + text.size(), v);
    if (r.ec != std::errc() || r.ptr != text.data() + text.size()) return false;
    out = v;
    return true;
}

bool parseFloat(std::string_view text, float &out) {
    if (!text.empty() && text[0] == '+') text.remove_prefix(1);
    if (text.empty() || text[0] == '+') return false;
    float v = 0.0f;
    auto r = std::from_chars(text.data(), text.data() + text.size(), v, std::chars_format::general);
    if (r.ec != std::errc() || r.ptr != text.data() + text.size() || !std::isfinite(v))
        return false;
    out = v;
    return true;
}

bool parseBool(std::string_view text, bool &out) {
    if (text == "1" || text == "true") {
        out = true;
        return true;
    }
    if (text == "0" || text == "false") {
        out = false;
        return true;
    }
    return false;
}

void appendFloatText(float v, std::string &out) {
    char buf[32];
    auto r = std::to_chars(buf, buf + sizeof buf, v);
    out.append(buf, r.ptr);
}

}  // namespace ox
