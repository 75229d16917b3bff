/// A list of texts in memory that forked children share with their parent.
#pragma once

#include <sys/mman.h>

#include <algorithm>
#include <atomic>
#include <cstdint>
#include <cstring>
#include <new>
#include <stdexcept>
#include <string>
#include <string_view>
#include <vector>

namespace fake {

/// Parent and children append at the same time; whoever reads sees what was complete by then.
/// Entries that find no room are dropped, and reading the list then throws.
class SharedList {
public:
    SharedList()
    {
        void *memory = mmap(nullptr, sizeof(Header) + CAPACITY, PROT_READ | PROT_WRITE,
                            MAP_SHARED | MAP_ANONYMOUS | MAP_NORESERVE, -1, 0);
        if (memory == MAP_FAILED)
            throw std::bad_alloc();
        header = new (memory) Header;
        entries = static_cast<char *>(memory) + sizeof(Header);
    }
    SharedList(const SharedList &) = delete;
    SharedList &operator=(const SharedList &) = delete;

    /// Only while no child is running.
    void clear()
    {
        memset(entries, 0, static_cast<size_t>(std::min<uint64_t>(header->used, CAPACITY)));
        header->used = 0;
        header->count = 0;
    }

    /// Returns the number of the entry, counted from 1.
    uint32_t append(std::string_view text)
    {
        const uint32_t number = ++header->count;
        const auto room =
            static_cast<uint32_t>((sizeof(Entry) + text.size() + alignof(Entry) - 1) & ~(alignof(Entry) - 1));
        // What found no room once finds none later: `used` stays beyond the end.
        const uint64_t start = header->used.fetch_add(room);
        if (start + room > CAPACITY)
            return number;
        auto *entry = new (entries + start) Entry;
        entry->length = static_cast<uint32_t>(text.size());
        text.copy(entries + start + sizeof(Entry), text.size());
        entry->room.store(room, std::memory_order_release);
        return number;
    }

    uint32_t count() const { return header->count; }

    std::vector<std::string> texts() const
    {
        if (header->used > CAPACITY)
            throw std::length_error("the fake's shared list is full: clear it between the cases");
        std::vector<std::string> result;
        for (uint64_t at = 0; at < header->used;) {
            const auto *entry = reinterpret_cast<const Entry *>(entries + at);
            const uint32_t room = entry->room.load(std::memory_order_acquire);
            if (room == 0)
                break; // being written
            result.emplace_back(entries + at + sizeof(Entry), entry->length);
            at += room;
        }
        return result;
    }

private:
    struct Header {
        std::atomic<uint64_t> used{0};
        std::atomic<uint32_t> count{0};
    };
    struct Entry {
        std::atomic<uint32_t> room{0};
        uint32_t length = 0;
    };
    static constexpr size_t CAPACITY = 16 << 20;

    Header *header;
    char *entries;
};

} // namespace fake
