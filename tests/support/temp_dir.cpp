#include "support/temp_dir.h"

#include <stdlib.h>

#include <stdexcept>

#include "platform/file.h"

namespace vaultora::test {

TempDir::TempDir() {
    const char* base = getenv("TMPDIR");
    std::string tmpl = std::string(base != nullptr ? base : "/tmp") + "/vaultora-test-XXXXXX";
    if (mkdtemp(tmpl.data()) == nullptr) throw std::runtime_error("mkdtemp failed");
    m_path = tmpl;
}

TempDir::~TempDir() { fs::removeTree(m_path); }

}  // namespace vaultora::test
