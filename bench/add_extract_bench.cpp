// Add/extract throughput on a generated corpus, next to tar | gzip -6 | gpg (AES256) and its
// extraction, run in the same invocation; first the peak memory of adding a 1 GiB file (measured
// before anything else has run, so the peak belongs to the add).
//
//   add_extract_bench [work folder] [--no-big]
//
// Prints MB/s (10^6 bytes per second of corpus) for each direction and the ratio ours/reference.
#include <sys/resource.h>
#include <sys/stat.h>

#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>
#include <vector>

#include "archive/extract.h"
#include "archive/password_ops.h"
#include "archive/walk.h"
#include "operations/add.h"
#include "platform/file.h"

using namespace vaultora;

namespace {

// Both sides encrypt with AES-256, so the comparison is like for like.
const PasswordRecord& benchPassword() {
    static const PasswordRecord p = PasswordRecord::fromUtf8("benchmark passphrase");
    return p;
}

KeyBlockParams benchParams() {
    KeyBlockParams p = DefaultKeyBlockParams();
    p.archiveAlg = 9;
    p.keyAlg = 9;
    return p;
}

}  // namespace

namespace {

struct Rng {
    uint64_t x;
    uint64_t next() {
        x ^= x << 13;
        x ^= x >> 7;
        x ^= x << 17;
        return x;
    }
};

uint64_t g_corpusBytes = 0;

void writeGenerated(const std::string& path, uint64_t size, int kind, uint64_t seed) {
    File f;
    if (f.open(path, OpenMode::kCreateAlways) != 0) { std::perror(path.c_str()); std::exit(1); }
    static const char* kWords[] = {"archive ", "cluster ", "folder ", "the ", "of ", "encrypted ", "record ", "table ",
                                   "Vaultora ", "data ", "\n", "and ", "key ", "block ", "unit "};
    Rng r{seed * 0x9E3779B97F4A7C15ull + 1};
    std::vector<uint8_t> buf(1 << 20);
    for (uint64_t off = 0; off < size;) {
        const size_t n = static_cast<size_t>(std::min<uint64_t>(buf.size(), size - off));
        if (kind == 0) {  // text
            size_t i = 0;
            while (i < n) {
                const char* w = kWords[r.next() % 15];
                for (; *w && i < n; ++w) buf[i++] = static_cast<uint8_t>(*w);
            }
        } else if (kind == 1) {  // binary: structured, partly compressible
            for (size_t i = 0; i < n; i += 8) {
                uint64_t v = r.next();
                if ((v & 3) != 0) v &= 0x00FF00FF00FF00FFull;
                std::memcpy(&buf[i], &v, std::min<size_t>(8, n - i));
            }
        } else {  // already compressed: random
            for (size_t i = 0; i < n; i += 8) {
                uint64_t v = r.next();
                std::memcpy(&buf[i], &v, std::min<size_t>(8, n - i));
            }
        }
        f.writeAt(off, buf.data(), n);
        off += n;
    }
    g_corpusBytes += size;
}

double seconds(std::chrono::steady_clock::time_point t0) {
    return std::chrono::duration<double>(std::chrono::steady_clock::now() - t0).count();
}

int run(const std::string& command) {
    int rc = std::system(command.c_str());
    if (rc != 0) std::fprintf(stderr, "command failed (%d): %s\n", rc, command.c_str());
    return rc;
}

long maxRssKb() {
    rusage u{};
    getrusage(RUSAGE_SELF, &u);
    return u.ru_maxrss;
}

}  // namespace

int main(int argc, char** argv) {
    std::string work = "/tmp/vaultora-bench";
    bool big = true;
    for (int i = 1; i < argc; ++i) {
        if (std::strcmp(argv[i], "--no-big") == 0) big = false;
        else work = argv[i];
    }
    fs::removeTree(work);
    const std::string corpus = work + "/corpus";
    fs::createDirectories(corpus + "/small");
    fs::createDirectories(corpus + "/text");
    fs::createDirectories(corpus + "/bin");
    fs::createDirectories(corpus + "/packed");
    if (big) {
        const std::string bigFile = work + "/one-gib.bin";
        writeGenerated(bigFile, 1ull << 30, 1, 42);
        g_corpusBytes = 0;
        const long before = maxRssKb();
        const std::string bigArchive = work + "/big.vra";
        const auto t0 = std::chrono::steady_clock::now();
        {
            Vaultora a(bigArchive);
            if (createWithPassword(a, benchParams(), benchPassword()) != kOk) return 1;
            Adder adder(a);
            ToAllFlags flags;
            if (adder.AddTree(u"", bigFile, flags, kModePlain) != kOk) return 1;
        }
        const double bigSeconds = seconds(t0);
        fs::removeFile(bigFile);
        fs::removeFile(bigArchive);
        const long after = maxRssKb();
        std::printf("\n1 GiB file: add %.1f MB/s, peak RSS before %ld KiB, after %ld KiB (growth %ld KiB)\n",
                    (1ull << 30) / 1e6 / bigSeconds, before, after, after - before);
    }
    std::printf("generating corpus in %s ...\n", corpus.c_str());
    for (int i = 0; i < 8; ++i) writeGenerated(corpus + "/text/t" + std::to_string(i) + ".txt", 2u << 20, 0, i);
    for (int i = 0; i < 8; ++i) writeGenerated(corpus + "/bin/b" + std::to_string(i) + ".bin", 2u << 20, 1, 100 + i);
    for (int i = 0; i < 8; ++i) writeGenerated(corpus + "/packed/p" + std::to_string(i) + ".gz", 2u << 20, 2, 200 + i);
    for (int i = 0; i < 20000; ++i) {
        const std::string sub = corpus + "/small/d" + std::to_string(i / 1000);
        if (i % 1000 == 0) fs::createDirectories(sub);
        writeGenerated(sub + "/f" + std::to_string(i) + ".txt", 64 + (i * 7919) % 4000, i % 3 == 0 ? 1 : 0, 1000 + i);
    }
    writeGenerated(corpus + "/large1.bin", 64u << 20, 1, 7);
    writeGenerated(corpus + "/large2.dat", 64u << 20, 2, 8);
    const double mb = static_cast<double>(g_corpusBytes) / 1e6;
    std::printf("corpus: %.1f MB in %d files\n", mb, 24 + 20000 + 2);
    std::system("sync");

    // Ours.
    const std::string archive = work + "/bench.vra";
    auto t0 = std::chrono::steady_clock::now();
    {
        Vaultora a(archive);
        if (createWithPassword(a, benchParams(), benchPassword()) != kOk) return 1;
        Adder adder(a);
        ToAllFlags flags;
        if (Result rc = adder.AddTree(u"", corpus, flags, kModePlain); rc != kOk) {
            std::fprintf(stderr, "add failed: %u\n", rc);
            return 1;
        }
        if (adder.flush() != kOk) return 1;
    }  // closing commits
    const double addSeconds = seconds(t0);
    const std::string out = work + "/out";
    fs::createDirectories(out);
    t0 = std::chrono::steady_clock::now();
    {
        Vaultora a(archive);
        OpenKey key;
        key.password = &benchPassword();
        if (a.open(key) != kOk) return 1;
        cExtractFileActorBlock actor(a, out);
        if (Result rc = walk(a, u"*", 0, u"", actor, nullptr); rc != kOk) {
            std::fprintf(stderr, "extract failed: %u\n", rc);
            return 1;
        }
    }
    const double extractSeconds = seconds(t0);
    const int64_t archiveSize = fs::fileSize(archive);
    fs::removeTree(out);

    // Reference: tar | gzip -6 | gpg --symmetric AES256, and back.
    const std::string pass = work + "/pass";
    fs::writeWholeFile(pass, "benchmark passphrase\n", 21);
    const std::string gpgOpts = "gpg --batch --yes --quiet --pinentry-mode loopback --passphrase-file '" + pass +
                                "' --homedir '" + work + "/gnupg'";
    fs::createDirectories(work + "/gnupg");
    t0 = std::chrono::steady_clock::now();
    if (run("tar -C '" + corpus + "' -cf - . | gzip -6 | " + gpgOpts + " --symmetric --cipher-algo AES256 -o '" + work +
            "/ref.tar.gz.gpg'") != 0)
        return 1;
    const double refAddSeconds = seconds(t0);
    fs::createDirectories(out);
    t0 = std::chrono::steady_clock::now();
    if (run(gpgOpts + " -d '" + work + "/ref.tar.gz.gpg' | gzip -d | tar -C '" + out + "' -xf -") != 0) return 1;
    const double refExtractSeconds = seconds(t0);
    const int64_t refSize = fs::fileSize(work + "/ref.tar.gz.gpg");
    fs::removeTree(out);

    std::printf("\n%-34s %10s %10s %10s\n", "", "ours", "reference", "ours/ref");
    std::printf("%-34s %10.1f %10.1f %10.2f\n", "add (MB/s)", mb / addSeconds, mb / refAddSeconds,
                refAddSeconds / addSeconds);
    std::printf("%-34s %10.1f %10.1f %10.2f\n", "extract (MB/s)", mb / extractSeconds, mb / refExtractSeconds,
                refExtractSeconds / extractSeconds);
    std::printf("%-34s %10.1f %10.1f\n", "output size (MB)", archiveSize / 1e6, refSize / 1e6);
    std::printf("(both sides encrypt with AES-256: our archive with cipher id 9, the reference with gpg)\n");

    fs::removeTree(work);
    return 0;
}
