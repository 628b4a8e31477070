#pragma once

#include <cstdint>
#include <string>
#include <string_view>

namespace orvanta {

// The address of a file upload. Pure functions; any thread.

// Leaves what may stand in a URL's query (letters, digits, "-._~", "!$&'()*+,;=", ":@/?"); every other byte becomes "%"
// and two upper-case hexadecimal digits.
std::string percentEncodeForQuery(std::string_view text);

// The last part of a path, slashes at its end aside; "/" of the root alone.
std::string_view lastPathComponent(std::string_view path);

// `deviceID` stands in the query as it is.
std::string fileUploadURL(std::string_view uploadURL, std::string_view deviceID, std::uint32_t sessionID,
                          std::string_view path);

// Returns whether the text is an absolute URL with a host, made of characters that URLs may hold, each "%" followed by
// two hexadecimal digits.
bool isValidURL(std::string_view text);

}  // namespace orvanta
