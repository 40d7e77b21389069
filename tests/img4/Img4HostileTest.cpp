// Damaged input: every answer is a status, and the address sanitizer sees no read beyond the buffer, which is of the
// exact size each time.
#include "img4/Img4.h"
#include "tests/support/Img4Answers.h"
#include "tools/makers/Img4Maker.h"

#include <algorithm>
#include <memory>

#include <gtest/gtest.h>

namespace {

using namespace img4answers;

struct Exact {
    explicit Exact(const img4maker::Bytes& bytes, std::size_t count)
        : octets(std::make_unique<std::uint8_t[]>(count)), length(count) {
        std::copy_n(bytes.begin(), count, octets.get());
    }

    std::unique_ptr<std::uint8_t[]> octets;
    std::size_t length;
};

TEST(Img4Hostile, noPrefixOfASoundFileIsTakenForOne) {
    const img4maker::Bytes container = img4maker::exampleContainer();
    const img4maker::Bytes ticket = img4maker::exampleTicket();
    for (std::size_t length = 0; length < container.size(); ++length) {
        const Exact cut(container, length);
        EXPECT_NE(ask(0, cut.octets.get(), length).front(), DERSuccess) << length;
        askAll(cut.octets.get(), length);
    }
    for (std::size_t length = 0; length < ticket.size(); ++length) {
        const Exact cut(ticket, length);
        EXPECT_NE(ask(2, cut.octets.get(), length).front(), DERSuccess) << length;
        askAll(cut.octets.get(), length);
    }
}

// None goes unnoticed: each changes a status, the place of a view or a digest.
TEST(Img4Hostile, everyFlippedBitChangesAnAnswer) {
    const img4maker::Bytes container = img4maker::exampleContainer();
    Exact buffer(container, container.size());
    const Answers sound = ask(0, buffer.octets.get(), buffer.length);
    ASSERT_EQ(sound.front(), DERSuccess);
    for (std::size_t bit = 0; bit < buffer.length * 8; ++bit) {
        const auto mask = static_cast<std::uint8_t>(1U << (bit % 8));
        buffer.octets[bit / 8] ^= mask;
        EXPECT_NE(ask(0, buffer.octets.get(), buffer.length), sound) << "bit " << bit % 8 << " of octet " << bit / 8;
        for (int other = 1; other < initialisations; ++other)
            ask(other, buffer.octets.get(), buffer.length);
        buffer.octets[bit / 8] ^= mask;
    }
}

TEST(Img4Hostile, everyFlippedBitOfATicketIsSurvived) {
    const img4maker::Bytes ticket = img4maker::exampleTicket();
    Exact buffer(ticket, ticket.size());
    for (std::size_t bit = 0; bit < buffer.length * 8; ++bit) {
        const auto mask = static_cast<std::uint8_t>(1U << (bit % 8));
        buffer.octets[bit / 8] ^= mask;
        askAll(buffer.octets.get(), buffer.length);
        buffer.octets[bit / 8] ^= mask;
    }
}

} // namespace
