#pragma once
// The directory cache: recently used directory clusters, by cluster number. In write-back mode
// (batch mode of the archive) changed clusters stay here until they are flushed or evicted.
#include <cstdint>
#include <functional>
#include <vector>

#include "platform/result.h"
#include "platform/secure.h"

namespace vaultora {

// A decoded cluster payload with its cluster number and dirty flag; wiped when released.
struct ChainBuffer {
    SecureBytes data;
    uint32_t cluster = 0xFFFFFFFF;
    bool dirty = false;
    void reset() {
        data.clear();
        data.shrink_to_fit();
        dirty = false;
    }
};

class DirectoryCache {
public:
    struct Slot {
        SecureBytes data;
        uint32_t cluster = 0xFFFFFFFF;
        bool dirty = false;
        uint32_t age = 0;
    };
    using Writer = std::function<Result(uint32_t cluster, const SecureBytes& data)>;

    explicit DirectoryCache(size_t slots = 50) : m_slots(slots) {}
    // Copies a cached cluster into out; false when not cached.
    bool lookup(uint32_t cluster, SecureBytes& out) const;
    // Stores the buffer. In write-back mode the slot takes the buffer's dirty flag (and the buffer's
    // is cleared); an evicted dirty slot is first written with `writer`.
    [[nodiscard]] Result store(ChainBuffer& buffer, const Writer& writer);
    void drop(uint32_t cluster);
    // Writes every dirty slot with `writer`; slots stay cached, clean.
    [[nodiscard]] Result flush(const Writer& writer);
    void clear();
    void setWriteBack(bool on) { m_writeBack = on; }
    bool writeBack() const { return m_writeBack; }
    bool hasDirty() const;

private:
    std::vector<Slot> m_slots;
    bool m_writeBack = false;
};

}  // namespace vaultora
