// Rows of a parameterised test print as their name, in test listings and failure
// messages, instead of as bytes. A test file brings it in with `using test::PrintTo;`
// inside the namespace of its row types.
#pragma once

#include <ostream>

namespace TavoPlayer::test {

template <typename Row>
requires requires(const Row& row) {
    *static_cast<std::ostream*>(nullptr) << row.name;
}
void PrintTo(const Row& row, std::ostream* os) {
    *os << row.name;
}

}  // namespace TavoPlayer::test
