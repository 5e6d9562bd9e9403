#pragma once

#include <string_view>
#include <vector>

namespace os {

// The pieces of |text| between occurrences of |separator|, empty ones included: "" gives one
// empty piece and "a," two. The views point into |text|.
std::vector<std::string_view> split(std::string_view text, char separator);

}  // namespace os
