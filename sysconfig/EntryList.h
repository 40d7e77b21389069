// The list in which an object keeps its entries of one kind: in order of insertion, and indexed by key so that adding,
// finding and removing take the same time in a long list as in a short one, whatever keys a blob brings along.
#ifndef VELTRA_SYSCONFIG_ENTRYLIST_H
#define VELTRA_SYSCONFIG_ENTRYLIST_H

#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <string_view>

namespace sysconfig {

// Secret parameters of an object's two hash functions. Whoever writes a blob does not know them, and so cannot choose
// keys that fall together.
struct HashSeed {
    std::uint64_t mix;
    std::uint64_t shift;
    std::uint64_t multiplier;
    std::uint64_t sip[2];
};

// Fills the seed from the random source.
bool seedHash(HashSeed* seed);

// The hash of a payload key. The last step is multiply-shift hashing, which makes any two keys collide with probability
// 2/n in n buckets. It alone would map evenly spaced keys to evenly spaced values, which now and then crowd a few
// buckets; the steps before it, which no two keys leave equal, break such patterns.
inline std::uint32_t hashOf(const HashSeed& seed, std::uint32_t key) {
    std::uint64_t value = seed.mix * key + seed.shift;
    value ^= value >> 32;
    return static_cast<std::uint32_t>((value * seed.multiplier) >> 32);
}

// The hash of a metadata key: SipHash-2-4.
std::uint32_t hashOf(const HashSeed& seed, std::string_view key);
std::uint64_t sipHash(const std::uint64_t (&key)[2], std::string_view message);

// A zeroed list is empty. An Entry is a record from malloc with the members `next`, `previous` and `bucketNext`, and
// indexKey() and indexHash(seed) to know it by. The list owns its entries.
template <typename Entry, typename Key>
struct EntryList {
    Entry* first;
    Entry* last;
    Entry** buckets;
    std::uint32_t count;
    std::uint8_t bucketBits;

    Entry* find(std::uint32_t hash, Key key) const {
        if (buckets == nullptr)
            return nullptr;
        Entry* entry = *bucket(hash);
        while (entry != nullptr && entry->indexKey() != key)
            entry = entry->bucketNext;
        return entry;
    }

    // Removes and releases every entry with the key, which may be a view into one of them.
    void remove(std::uint32_t hash, Key key) {
        if (buckets == nullptr)
            return;
        Entry* removed = nullptr;
        Entry** place = bucket(hash);
        while (*place != nullptr) {
            Entry* const entry = *place;
            if (entry->indexKey() != key) {
                place = &entry->bucketNext;
                continue;
            }
            *place = entry->bucketNext;
            unlink(entry);
            entry->bucketNext = removed;
            removed = entry;
        }
        while (removed != nullptr) {
            Entry* const entry = removed;
            removed = entry->bucketNext;
            std::free(entry);
        }
    }

    // Appends an entry in place of those with the same key. False, with nothing changed, when memory is lacking.
    bool add(Entry* entry, const HashSeed& seed) {
        if (!reserveOne(seed))
            return false;
        const std::uint32_t hash = entry->indexHash(seed);
        remove(hash, entry->indexKey());
        appendWithoutIndex(entry);
        chain(entry, hash);
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
    //
    // In a long list hardly any bucket is in the processor's cache when its turn comes. Two cursors run ahead, of which
    // the first fetches the bucket of a coming entry and the second the entry that the bucket holds already.
    bool indexAll(const HashSeed& seed) {
        constexpr int lead = 8;
        if (first == nullptr)
            return true;
        if (!makeBuckets(count))
            return false;
        Entry* bucketCursor = first;
        Entry* headCursor = first;
        for (int i = 0; i < 2 * lead; ++i)
            bucketCursor = fetchBucket(bucketCursor, seed);
        for (int i = 0; i < lead; ++i)
            headCursor = fetchHead(headCursor, seed);
        for (Entry* entry = first; entry != nullptr; entry = entry->next) {
            bucketCursor = fetchBucket(bucketCursor, seed);
            headCursor = fetchHead(headCursor, seed);
            const std::uint32_t hash = entry->indexHash(seed);
            remove(hash, entry->indexKey());
            chain(entry, hash);
        }
        return true;
    }

    // Releases all entries and the index.
    void clear() {
        while (first != nullptr) {
            Entry* const entry = first;
            first = entry->next;
            std::free(entry);
        }
        std::free(buckets);
        *this = {};
    }

    std::uint64_t bucketCount() const { return std::uint64_t{1} << bucketBits; }
    Entry** bucket(std::uint32_t hash) const { return &buckets[hash >> (32 - bucketBits)]; }

private:
    // Makes room in the index for one more entry.
    bool reserveOne(const HashSeed& seed) {
        if (buckets != nullptr && count < bucketCount())
            return true;
        if (!makeBuckets(std::uint64_t{count} + 1))
            return false;
        for (Entry* entry = first; entry != nullptr; entry = entry->next)
            chain(entry, entry->indexHash(seed));
        return true;
    }

    // Replaces the index by an empty one for `capacity` entries.
    bool makeBuckets(std::uint64_t capacity) {
        std::uint8_t bits = 3;
        while (bits < 32 && std::uint64_t{1} << bits < capacity)
            ++bits;
        auto** made = static_cast<Entry**>(std::calloc(std::size_t{1} << bits, sizeof(Entry*)));
        if (made == nullptr)
            return false;
        std::free(buckets);
        buckets = made;
        bucketBits = bits;
        return true;
    }

    Entry* fetchBucket(Entry* entry, const HashSeed& seed) const {
        if (entry == nullptr)
            return nullptr;
        __builtin_prefetch(bucket(entry->indexHash(seed)));
        return entry->next;
    }

    Entry* fetchHead(Entry* entry, const HashSeed& seed) const {
        if (entry == nullptr)
            return nullptr;
        __builtin_prefetch(*bucket(entry->indexHash(seed)));
        return entry->next;
    }

    void chain(Entry* entry, std::uint32_t hash) {
        Entry** const place = bucket(hash);
        entry->bucketNext = *place;
        *place = entry;
    }

    void unlink(Entry* entry) {
        (entry->previous != nullptr ? entry->previous->next : first) = entry->next;
        (entry->next != nullptr ? entry->next->previous : last) = entry->previous;
        --count;
    }
};

} // namespace sysconfig

#endif
