// Damaged input: every answer is a status, and the address sanitizer sees no read beyond the buffer, which is of the
// exact size each time.
#include "img4/Img4.h"
#include "tests/support/Img4Answers.h"
#include "tools/makers/Img4Maker.h"

#include <algorithm>
#include <memory>
#include <utility>

#include <gtest/gtest.h>

namespace {

using namespace img4answers;

// The answers to the first `length` octets, from memory of that very size.
Answers askExactly(int initialisation, const img4maker::Bytes& bytes, std::size_t length) {
    const auto octets = std::make_unique<std::uint8_t[]>(length);
    std::copy_n(bytes.begin(), length, octets.get());
    return ask(initialisation, octets.get(), length);
}

const std::pair<int, img4maker::Bytes> files[] = {{0, img4maker::exampleContainer()}, {2, img4maker::exampleTicket()}};

TEST(Img4Hostile, noPrefixOfASoundFileIsTakenForOne) {
    for (const auto& [initialisation, file] : files)
        for (std::size_t length = 0; length < file.size(); ++length)
            EXPECT_NE(askExactly(initialisation, file, length).front(), DERSuccess) << length;
}

// None goes unnoticed in a container: each changes a status, the place of a view or a digest.
TEST(Img4Hostile, everyFlippedBitChangesAnAnswer) {
    for (auto [initialisation, file] : files) {
        const Answers sound = askExactly(initialisation, file, file.size());
        ASSERT_EQ(sound.front(), DERSuccess);
        for (std::size_t bit = 0; bit < file.size() * 8; ++bit) {
            const auto mask = static_cast<std::uint8_t>(1U << (bit % 8));
            file[bit / 8] ^= mask;
            EXPECT_NE(askExactly(initialisation, file, file.size()), sound)
                << "bit " << bit % 8 << " of octet " << bit / 8;
            file[bit / 8] ^= mask;
        }
    }
}

} // namespace
