// Asks the Img4 decoder everything about a buffer: for tests that compare its answers, and for fuzzing.
#ifndef VELTRA_TESTS_SUPPORT_IMG4ANSWERS_H
#define VELTRA_TESTS_SUPPORT_IMG4ANSWERS_H

#include <cstddef>
#include <cstdint>
#include <vector>

namespace img4answers {

using Answers = std::vector<std::uint64_t>;

// The four initialisations.
constexpr int initialisations = 4;

// Initialises a record from the `length` octets at `data` in the way `initialisation` says (0 to 3: container, payload,
// manifest, unsigned manifest) and runs every query on it. The answers are statuses, numbers, and for each view its
// place in the buffer and a digest of its octets. After a failed initialisation they are that status alone. Ends the
// process when a view leaves the buffer.
Answers ask(int initialisation, const std::uint8_t* data, std::size_t length);

// All four after one another.
Answers askAll(const std::uint8_t* data, std::size_t length);

} // namespace img4answers

#endif
