#pragma once

// TEST_P cases whose parameter has a `name`: the case is named after it (kCaseName), and gtest
// prints the parameter as that name instead of its bytes. ADL finds PrintTo through
// `using zaf::test::PrintTo;` in the namespace of the case's type.

#include <ostream>
#include <string>

namespace zaf::test {

inline constexpr auto kCaseName = [](const auto &info) { return std::string(info.param.name); };

template <typename Case>
    requires requires(const Case &c) { c.name; }
void PrintTo(const Case &c, std::ostream *os) { *os << c.name; }

} // namespace zaf::test
