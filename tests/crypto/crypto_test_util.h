#pragma once
// Small helpers shared by the crypto tests: hex conversion and test data files.
#include <cstdint>
#include <fstream>
#include <iterator>
#include <sstream>
#include <string>
#include <vector>

namespace vaultora::test {

inline std::vector<uint8_t> unhex(const std::string& hex) {
    std::vector<uint8_t> out;
    for (size_t i = 0; i + 1 < hex.size(); i += 2) out.push_back(static_cast<uint8_t>(std::stoul(hex.substr(i, 2), nullptr, 16)));
    return out;
}

template <class Bytes>
std::string hex(const Bytes& b) {
    static const char k[] = "0123456789abcdef";
    std::string s;
    for (uint8_t c : b) {
        s.push_back(k[c >> 4]);
        s.push_back(k[c & 15]);
    }
    return s;
}

inline std::string dataPath(const std::string& name) { return std::string(VAULTORA_TEST_DATA) + "/crypto/" + name; }

inline std::vector<uint8_t> readData(const std::string& name) {
    std::ifstream f(dataPath(name), std::ios::binary);
    return std::vector<uint8_t>(std::istreambuf_iterator<char>(f), std::istreambuf_iterator<char>());
}

// The non-comment lines of a data file, split at blanks.
inline std::vector<std::vector<std::string>> readVectorLines(const std::string& name) {
    std::ifstream f(dataPath(name));
    std::vector<std::vector<std::string>> rows;
    std::string line;
    while (std::getline(f, line)) {
        if (line.empty() || line[0] == '#') continue;
        std::istringstream is(line);
        std::vector<std::string> fields;
        for (std::string w; is >> w;) fields.push_back(w);
        rows.push_back(fields);
    }
    return rows;
}

}  // namespace vaultora::test
