#pragma once

#include <cstdint>
#include <string>
#include <string_view>

/// Strict reading of the text forms of settings values.
namespace ox {

/// The text without leading and trailing spaces, tabs, line feeds and carriage returns.
std::string_view trimXmlSpace(std::string_view text);

/// Reads a whole decimal int32 (optional sign); false on any other text or overflow.
bool parseInt32(std::string_view text, int32_t &out);
/// Reads a whole decimal uint32 (optional "+"; a minus sign is refused); false otherwise.
bool parseUInt32(std::string_view text, uint32_t &out);
/// Reads a whole finite float (decimal or scientific, optional sign); false otherwise.
bool parseFloat(std::string_view text, float &out);
/// Reads "0", "1", "true" or "false"; false otherwise.
bool parseBool(std::string_view text, bool &out);

/// Appends the shortest text that reads back to the same float.
void appendFloatText(float v, std::string &out);

}  // namespace ox
