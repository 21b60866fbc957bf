#include "archive/dir_cache.h"

namespace vaultora {

bool DirectoryCache::lookup(uint32_t cluster, SecureBytes& out) const {
    for (const Slot& s : m_slots) {
        if (s.cluster == cluster) {
            out = s.data;
            return true;
        }
    }
    return false;
}

Result DirectoryCache::store(ChainBuffer& buffer, const Writer& writer) {
    Slot* target = nullptr;
    for (Slot& s : m_slots)
        if (s.cluster == buffer.cluster) target = &s;
    if (target == nullptr) {
        for (Slot& s : m_slots)
            if (s.cluster == 0xFFFFFFFF) { target = &s; break; }
    }
    if (target == nullptr) {
        target = &m_slots[0];
        for (Slot& s : m_slots)
            if (s.age > target->age) target = &s;
        if (m_writeBack && target->dirty && writer) {
            if (Result rc = writer(target->cluster, target->data); rc != kOk) return rc;
        }
    }
    // A slot that already held unsaved changes of this cluster stays dirty.
    const bool keepDirty = target->cluster == buffer.cluster && target->dirty;
    target->data = buffer.data;
    target->cluster = buffer.cluster;
    if (m_writeBack) {
        target->dirty = keepDirty || buffer.dirty;
        buffer.dirty = false;
    } else {
        target->dirty = false;
    }
    for (Slot& s : m_slots)
        if (&s != target && s.cluster != 0xFFFFFFFF) ++s.age;
    target->age = 0;
    return kOk;
}

void DirectoryCache::drop(uint32_t cluster) {
    for (Slot& s : m_slots) {
        if (s.cluster == cluster) {
            s.data.clear();
            s.cluster = 0xFFFFFFFF;
            s.dirty = false;
            s.age = 0;
        }
    }
}

Result DirectoryCache::flush(const Writer& writer) {
    for (Slot& s : m_slots) {
        if (s.cluster != 0xFFFFFFFF && s.dirty) {
            if (Result rc = writer(s.cluster, s.data); rc != kOk) return rc;
            s.dirty = false;
        }
    }
    return kOk;
}

void DirectoryCache::clear() {
    for (Slot& s : m_slots) {
        s.data.clear();
        s.cluster = 0xFFFFFFFF;
        s.dirty = false;
        s.age = 0;
    }
}

bool DirectoryCache::hasDirty() const {
    for (const Slot& s : m_slots)
        if (s.cluster != 0xFFFFFFFF && s.dirty) return true;
    return false;
}

}  // namespace vaultora
