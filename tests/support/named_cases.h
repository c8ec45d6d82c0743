#pragma once

// Tables of named cases: a case struct with a `name` member names its test (caseName, the last
// argument of INSTANTIATE_TEST_SUITE_P) and, with ZAF_PRINT_CASES_AS_NAMES in the struct's
// namespace, prints as that name in the test's messages instead of as raw bytes.

#include <ostream>
#include <string>

namespace zaf::test {

inline constexpr auto caseName = [](const auto &info) { return std::string(info.param.name); };

} // namespace zaf::test

#define ZAF_PRINT_CASES_AS_NAMES                                                                   \
    template <typename Case>                                                                       \
        requires requires(const Case &c) { c.name; }                                               \
    [[maybe_unused]] void PrintTo(const Case &c, std::ostream *os)                                 \
    {                                                                                              \
        *os << c.name;                                                                             \
    }
