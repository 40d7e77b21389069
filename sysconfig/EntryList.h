// The list in which an object keeps its entries of one kind: in order of insertion, and indexed by key so that adding,
// finding and removing take the same time in a long list as in a short one, whatever keys a blob brings along.
#ifndef VELTRA_SYSCONFIG_ENTRYLIST_H
#define VELTRA_SYSCONFIG_ENTRYLIST_H

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <string_view>
#include <utility>

#include "platform/Memory.h"

namespace sysconfig {

// The secret key of an object's hash function, from the random source. Whoever writes a blob does not know it, and so
// cannot choose keys that fall together.
struct HashSecret {
    std::uint64_t words[2];
};

// The halves of the product of 128 bits, one laid over the other. Not every machine has a type for the whole.
inline std::uint64_t foldedProduct(std::uint64_t a, std::uint64_t b) {
    const std::uint64_t aLow = a & UINT32_MAX, aHigh = a >> 32, bLow = b & UINT32_MAX, bHigh = b >> 32;
    const std::uint64_t middle = aHigh * bLow + (aLow * bLow >> 32);
    const std::uint64_t high = aHigh * bHigh + (middle >> 32) + ((aLow * bHigh + (middle & UINT32_MAX)) >> 32);
    return (a * b) ^ high;
}

// The hash function of the index, over a message that comes as words. A step folds the product of state and secret, so
// that without the secret nobody can tell which keys fall together, or steer any towards each other: an index needs no
// more against floods, since it never shows a hash. The last step also breaks the even spacing that evenly spaced keys
// keep in the first.
struct Hash {
    const HashSecret& secret;
    std::uint64_t state = secret.words[0];

    void absorb(std::uint64_t word) { state = foldedProduct(state ^ word, secret.words[1] | 1); }
};

inline std::uint64_t hashOf(const HashSecret& secret, std::uint32_t key) {
    Hash hash = {secret};
    hash.absorb(key);
    hash.absorb(sizeof key);
    return hash.state;
}

inline std::uint64_t hashOf(const HashSecret& secret, std::string_view key) {
    Hash hash = {secret};
    for (std::string_view rest = key; !rest.empty(); rest.remove_prefix(std::min(rest.size(), sizeof(std::uint64_t)))) {
        std::uint64_t word = 0;
        std::memcpy(&word, rest.data(), std::min(rest.size(), sizeof word));
        hash.absorb(word);
    }
    hash.absorb(key.size());
    return hash.state;
}

// Memory for the entries of a blob, in few blocks: what an entry costs is mostly the memory that it is the first to
// touch. What is taken is given back as a whole. Zeroed it is empty.
struct Blocks {
    struct Block {
        Block* earlier;
    };
    Block* last;
    std::uint8_t* next;
    std::size_t left;

    // `size` octets, aligned, for an entry that has `octets` of the `rest` of a blob's list, in a block that has room
    // for the rest if the others are like it. Null when memory is lacking.
    void* take(std::size_t size, std::uint64_t octets, std::uint64_t rest) {
        constexpr std::size_t smallest = 1024;
        size = (size + alignof(Block) - 1) / alignof(Block) * alignof(Block);
        if (left < size) {
            const std::uint64_t expected = std::min<std::uint64_t>(size * rest / octets, PTRDIFF_MAX / 2);
            const std::size_t wanted = std::max({static_cast<std::size_t>(expected), size, smallest});
            auto* const made = static_cast<Block*>(std::malloc(sizeof(Block) + wanted));
            if (made == nullptr)
                return nullptr;
            memory::willBeFilled(made, wanted);
            *made = {last};
            last = made;
            next = reinterpret_cast<std::uint8_t*>(made + 1);
            left = wanted;
        }
        left -= size;
        return std::exchange(next, next + size);
    }

    void clear() {
        while (last != nullptr)
            std::free(std::exchange(last, last->earlier));
        *this = {};
    }
};

// A zeroed list is empty. An Entry is a record with the members `next`, `previous`, `bucketNext` and `isInBlock`, and
// indexKey() to know it by. It is from malloc, or in one of the list's blocks. The list owns its entries, of which no
// two in the index have one key.
template <typename Entry, typename Key>
struct EntryList {
    Entry* first;
    Entry* last;
    Entry** buckets;
    Blocks blocks;
    std::uint32_t count;
    std::uint8_t bucketBits;

    Entry* find(const HashSecret& secret, Key key) const {
        return buckets != nullptr ? *linkTo(key, bucketOf(secret, key)) : nullptr;
    }

    // Removes and releases the entry with the key, which may be a view into it.
    void remove(const HashSecret& secret, Key key) {
        if (buckets != nullptr)
            releaseAt(linkTo(key, bucketOf(secret, key)));
    }

    // Appends an entry in place of the one with the same key. False, with nothing changed, when memory is lacking.
    bool add(Entry* entry, const HashSecret& secret) {
        if ((buckets == nullptr || count >= bucketCount()) && !makeIndex(std::uint64_t{count} + 1, secret))
            return false;
        appendWithoutIndex(entry);
        index(entry, bucketOf(secret, entry->indexKey()));
        return true;
    }

    // Appends an entry whose key nobody has looked for. Once all are there, indexAll must follow.
    void appendWithoutIndex(Entry* entry) {
        entry->next = nullptr;
        entry->previous = last;
        (last != nullptr ? last->next : first) = entry;
        last = entry;
        ++count;
    }

    // Makes the index of a list that was filled without one. Of the entries with one key the last stays, as if each had
    // been added in turn. False, with nothing changed, when memory is lacking.
    bool indexAll(const HashSecret& secret) { return first == nullptr || makeIndex(count, secret); }

    // Releases all entries and the index.
    void clear() {
        while (first != nullptr) {
            Entry* const entry = first;
            first = entry->next;
            release(entry);
        }
        blocks.clear();
        std::free(buckets);
        *this = {};
    }

    std::uint64_t bucketCount() const { return std::uint64_t{1} << bucketBits; }

private:
    Entry** bucketOf(const HashSecret& secret, Key key) const {
        return &buckets[hashOf(secret, key) >> (64 - bucketBits)];
    }

    // The link, from `link` on, that leads to the entry with the key, or the null one at the end.
    static Entry** linkTo(Key key, Entry** link) {
        while (*link != nullptr && (*link)->indexKey() != key)
            link = &(*link)->bucketNext;
        return link;
    }

    // Takes the entry to which the link leads, if any, out of index and list.
    void releaseAt(Entry** link) {
        Entry* const entry = *link;
        if (entry == nullptr)
            return;
        *link = entry->bucketNext;
        (entry->previous != nullptr ? entry->previous->next : first) = entry->next;
        (entry->next != nullptr ? entry->next->previous : last) = entry->previous;
        --count;
        release(entry);
    }

    static void release(Entry* entry) {
        if (!entry->isInBlock)
            std::free(entry);
    }

    // Puts an entry of the list into the index, and the one with the same key out of both.
    void index(Entry* entry, Entry** bucket) {
        releaseAt(linkTo(entry->indexKey(), bucket));
        entry->bucketNext = *bucket;
        *bucket = entry;
    }

    // Makes the index anew, for `capacity` entries.
    bool makeIndex(std::uint64_t capacity, const HashSecret& secret) {
        std::uint8_t bits = 3;
        while (bits < 32 && std::uint64_t{1} << bits < capacity)
            ++bits;
        auto** made = static_cast<Entry**>(std::calloc(std::size_t{1} << bits, sizeof(Entry*)));
        if (made == nullptr)
            return false;
        memory::willBeFilled(made, sizeof(Entry*) << bits);
        std::free(buckets);
        buckets = made;
        bucketBits = bits;
        for (Entry* entry = first; entry != nullptr;)
            entry = indexSome(entry, secret);
        return true;
    }

    // Puts some entries into the index, from `entry` on, and gives out the one behind them. In a long list each bucket,
    // and each entry that one leads to, has to come from memory: those of all are asked for before any is waited for.
    Entry* indexSome(Entry* entry, const HashSecret& secret) {
        constexpr std::size_t most = 64;
        Entry** found[most];
        std::size_t number = 0;
        for (Entry* next = entry; next != nullptr && number < most; next = next->next) {
            found[number] = bucketOf(secret, next->indexKey());
            __builtin_prefetch(found[number++], 1);
        }
        for (std::size_t i = 0; i < number; ++i)
            __builtin_prefetch(*found[i]);
        for (std::size_t i = 0; i < number; ++i, entry = entry->next)
            index(entry, found[i]);
        return entry;
    }
};

} // namespace sysconfig

#endif
