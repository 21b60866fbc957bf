#pragma once
// Runs the built vaultora program the way a script does: in its own session (so it has no
// controlling terminal and can never wait for one), with standard input from /dev/null, in a
// private HOME, capturing standard output and standard error.
#include <fcntl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <map>
#include <optional>
#include <string>
#include <vector>

#include "platform/file.h"
#include "support/temp_dir.h"

namespace vaultora::test {

struct ProgramResult {
    int status = -1;  // exit status; -1 when the program did not exit normally
    std::string out, err;
};

class ProgramHome {
public:
    ProgramHome() {
        (void)fs::createDirectories(m_home / "run", 0700);
        m_env["HOME"] = m_home.path();
        m_env["XDG_CONFIG_HOME"] = m_home / "config";
        m_env["XDG_RUNTIME_DIR"] = m_home / "run";
        m_env["XDG_STATE_HOME"] = m_home / "state";
        m_env["XDG_DATA_HOME"] = m_home / "data";
    }
    const std::string& path() const { return m_home.path(); }
    std::string operator/(const std::string& name) const { return m_home / name; }
    // Sets (or, with nullopt, removes) an environment variable of the runs.
    void setEnv(const std::string& name, std::optional<std::string> value) {
        if (value) m_env[name] = *value;
        else m_env.erase(name);
    }
    // Writes `password` as the first line of a file and names it in VAULTORA_PASSWORD_FILE.
    void usePassword(const std::string& password) {
        const std::string file = m_home / ("pw-" + std::to_string(++m_files));
        const std::string text = password + "\n";
        (void)fs::writeWholeFile(file, text.data(), text.size());
        setEnv("VAULTORA_PASSWORD_FILE", file);
    }

    ProgramResult run(const std::vector<std::string>& args, const std::string& cwd = "") const {
        TempDir capture;
        const std::string outPath = capture / "out", errPath = capture / "err";
        std::vector<std::string> envText;
        for (char** e = environ; *e != nullptr; ++e) {
            std::string kv = *e;
            const std::string name = kv.substr(0, kv.find('='));
            if (m_env.count(name) == 0 && name != "VAULTORA_PASSWORD_FILE") envText.push_back(kv);
        }
        for (const auto& [k, v] : m_env) envText.push_back(k + "=" + v);
        std::vector<char*> envp;
        for (std::string& s : envText) envp.push_back(s.data());
        envp.push_back(nullptr);
        std::string program = VAULTORA_BINARY;
        std::vector<std::string> argText = args;
        std::vector<char*> argv{program.data()};
        for (std::string& a : argText) argv.push_back(a.data());
        argv.push_back(nullptr);
        const std::string dir = cwd.empty() ? m_home.path() : cwd;

        ProgramResult r;
        const pid_t pid = fork();
        if (pid == 0) {
            setsid();
            int in = open("/dev/null", O_RDONLY);
            int out = open(outPath.c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0600);
            int err = open(errPath.c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0600);
            if (in < 0 || out < 0 || err < 0 || dup2(in, 0) < 0 || dup2(out, 1) < 0 || dup2(err, 2) < 0 ||
                chdir(dir.c_str()) != 0)
                _exit(127);
            execve(program.c_str(), argv.data(), envp.data());
            _exit(127);
        }
        int status = 0;
        if (pid > 0 && waitpid(pid, &status, 0) == pid && WIFEXITED(status)) r.status = WEXITSTATUS(status);
        std::vector<uint8_t> bytes;
        if (fs::readWholeFile(outPath, bytes)) r.out.assign(bytes.begin(), bytes.end());
        if (fs::readWholeFile(errPath, bytes)) r.err.assign(bytes.begin(), bytes.end());
        return r;
    }

private:
    TempDir m_home;
    std::map<std::string, std::string> m_env;
    int m_files = 0;
};

// UTF-16LE bytes (with the byte-order mark when asked) of UTF-8 text, and back.
inline std::string utf16le(const std::u16string& text, bool bom) {
    std::string s = bom ? std::string("\xFF\xFE") : std::string();
    for (char16_t c : text) {
        s.push_back(static_cast<char>(c & 0xFF));
        s.push_back(static_cast<char>(c >> 8));
    }
    return s;
}
inline std::u16string fromUtf16le(const std::vector<uint8_t>& bytes, size_t from = 0) {
    std::u16string s;
    for (size_t i = from; i + 1 < bytes.size(); i += 2) s.push_back(static_cast<char16_t>(bytes[i] | (bytes[i + 1] << 8)));
    return s;
}

// The log text with the timestamp at the start of each line replaced by "TS"; a line start that
// is not a well-formed timestamp ("2026/12/6  09:05:03:042": month 1-12 and day 1-31 without
// leading zeros, 24-hour time, milliseconds) is left as it is, so a comparison shows it.
inline std::string maskLogTimestamps(const std::string& text) {
    auto number = [&](size_t& at, size_t minDigits, size_t maxDigits, int low, int high) {
        size_t n = 0;
        int value = 0;
        while (at + n < text.size() && n < maxDigits && text[at + n] >= '0' && text[at + n] <= '9')
            value = value * 10 + (text[at + n++] - '0');
        if (n < minDigits || value < low || value > high || (n > 1 && maxDigits == 2 && minDigits == 1 && text[at] == '0'))
            return false;
        at += n;
        return true;
    };
    auto literal = [&](size_t& at, const char* s) {
        const std::string lit(s);
        if (text.compare(at, lit.size(), lit) != 0) return false;
        at += lit.size();
        return true;
    };
    std::string out;
    size_t line = 0;
    while (line < text.size()) {
        size_t at = line;
        const bool stamp = number(at, 4, 4, 1970, 9999) && literal(at, "/") && number(at, 1, 2, 1, 12) &&
                           literal(at, "/") && number(at, 1, 2, 1, 31) && literal(at, "  ") && number(at, 2, 2, 0, 23) &&
                           literal(at, ":") && number(at, 2, 2, 0, 59) && literal(at, ":") && number(at, 2, 2, 0, 59) &&
                           literal(at, ":") && number(at, 3, 3, 0, 999);
        size_t end = text.find("\r\n", line);
        end = end == std::string::npos ? text.size() : end + 2;
        out += stamp ? "TS" + text.substr(at, end - at) : text.substr(line, end - line);
        line = end;
    }
    return out;
}

}  // namespace vaultora::test
