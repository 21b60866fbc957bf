#include "platform/secure.h"

#include <cstring>
#include <string.h>

#include "platform/text.h"

namespace vaultora {

void secureWipe(void* p, size_t n) noexcept {
    if (p != nullptr && n != 0) explicit_bzero(p, n);
}

PasswordRecord PasswordRecord::fromUtf8(std::string_view text) {
    PasswordRecord r;
    r.narrow.assign(text.begin(), text.end());
    std::u16string w = vaultora::fromUtf8(text);
    r.wide.assign(w.begin(), w.end());
    secureWipe(w.data(), w.size() * sizeof(char16_t));
    return r;
}

}  // namespace vaultora
