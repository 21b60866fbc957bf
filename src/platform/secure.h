#pragma once
// Buffers for secrets (passwords, keys, decrypted data) that are overwritten with zeros before
// their memory is released.
#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

namespace vaultora {

// Overwrites n bytes at p with zeros in a way the compiler may not remove.
void secureWipe(void* p, size_t n) noexcept;

template <class T>
struct WipingAllocator {
    using value_type = T;
    WipingAllocator() noexcept = default;
    template <class U> WipingAllocator(const WipingAllocator<U>&) noexcept {}
    T* allocate(size_t n) { return static_cast<T*>(::operator new(n * sizeof(T))); }
    void deallocate(T* p, size_t n) noexcept {
        secureWipe(p, n * sizeof(T));
        ::operator delete(p);
    }
    template <class U> bool operator==(const WipingAllocator<U>&) const noexcept { return true; }
};

using SecureBytes = std::vector<uint8_t, WipingAllocator<uint8_t>>;
using SecureString = std::basic_string<char, std::char_traits<char>, WipingAllocator<char>>;
using SecureU16String = std::basic_string<char16_t, std::char_traits<char16_t>, WipingAllocator<char16_t>>;

// A password in the two forms key derivation uses: the narrow form (UTF-8) and the UTF-16 form.
struct PasswordRecord {
    SecureString narrow;
    SecureU16String wide;
    bool empty() const { return wide.empty() && narrow.empty(); }
    void clear() { narrow.clear(); wide.clear(); }
    // Fills both forms from UTF-8 text.
    static PasswordRecord fromUtf8(std::string_view text);
};

}  // namespace vaultora
