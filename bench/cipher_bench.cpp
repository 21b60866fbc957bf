// CBC throughput of every cipher of the archive's table over 512 KiB buffers (the size of one
// cluster record), with Botan's own AES-256/CBC mode as a reference in the same run.
#include <botan/cipher_mode.h>

#include <chrono>
#include <cstdio>
#include <vector>

#include "crypto/sym_alg.h"
#include "crypto/sym_alg_table.h"

using namespace vaultora;

namespace {

constexpr size_t kBufferSize = 512 * 1024;
constexpr double kMinSeconds = 0.3;

template <class F>
double megabytesPerSecond(F&& run) {
    using Clock = std::chrono::steady_clock;
    size_t rounds = 0;
    auto start = Clock::now();
    double seconds = 0;
    do {
        if (!run()) return -1;
        ++rounds;
        seconds = std::chrono::duration<double>(Clock::now() - start).count();
    } while (seconds < kMinSeconds);
    return static_cast<double>(rounds * kBufferSize) / (1024.0 * 1024.0) / seconds;
}

}  // namespace

int main() {
    std::vector<uint8_t> buffer(kBufferSize);
    for (size_t i = 0; i < buffer.size(); ++i) buffer[i] = static_cast<uint8_t>(i * 31 + 7);
    std::vector<uint8_t> key(64, 0x42);

    std::printf("%-24s %5s %12s %12s\n", "cipher", "id", "enc MB/s", "dec MB/s");
    const uint32_t ids[] = {1, 2, 3, 4, 128, 129, 138, 10, 133, 136, 7, 8, 9, 137, 131};
    for (uint32_t id : ids) {
        std::unique_ptr<cSymAlg> alg;
        if (CreateSymAlg(id, key.data(), static_cast<int32_t>(SymAlgKeySize(id)), alg) != kOk) {
            std::printf("%-24s %5u  cannot be created\n", SymAlgName(static_cast<uint8_t>(id)), id);
            continue;
        }
        const int32_t n = static_cast<int32_t>(buffer.size());
        double enc = megabytesPerSecond([&] { return CbcEncrypt(alg.get(), nullptr, buffer.data(), buffer.data(), n) == kOk; });
        double dec = megabytesPerSecond([&] { return CbcDecrypt(alg.get(), nullptr, buffer.data(), buffer.data(), n) == kOk; });
        std::printf("%-24s %5u %12.1f %12.1f\n", SymAlgName(static_cast<uint8_t>(id)), id, enc, dec);
    }

    // Reference: Botan's own CBC mode over AES-256, same buffer size, zero IV.
    try {
        auto encMode = Botan::Cipher_Mode::create_or_throw("AES-256/CBC/NoPadding", Botan::ENCRYPTION);
        auto decMode = Botan::Cipher_Mode::create_or_throw("AES-256/CBC/NoPadding", Botan::DECRYPTION);
        encMode->set_key(key.data(), 32);
        decMode->set_key(key.data(), 32);
        const std::vector<uint8_t> iv(16, 0);
        double enc = megabytesPerSecond([&] {
            encMode->start(iv.data(), iv.size());
            encMode->process(buffer.data(), buffer.size());
            return true;
        });
        double dec = megabytesPerSecond([&] {
            decMode->start(iv.data(), iv.size());
            decMode->process(buffer.data(), buffer.size());
            return true;
        });
        std::printf("%-24s %5s %12.1f %12.1f\n", "Botan AES-256/CBC", "ref", enc, dec);
    } catch (const std::exception& e) {
        std::printf("Botan AES-256/CBC reference unavailable: %s\n", e.what());
    }
    return 0;
}
