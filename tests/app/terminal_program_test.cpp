// The program on a real (pseudo) terminal: password prompts without echo, a new archive's password
// asked twice, a wrong password asked again.
#include <gtest/gtest.h>

#include <poll.h>
#include <pty.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>

#include "program_run.h"

namespace vaultora {
namespace {

struct Step {
    std::string waitFor;  // text the program shows (counted from the end of the previous step)
    std::string send;     // what is typed then
};

struct TerminalRun {
    int status = -1;
    std::string screen;
};

TerminalRun runOnTerminal(const test::ProgramHome& home, const std::vector<std::string>& args,
                          const std::vector<Step>& steps) {
    TerminalRun result;
    std::vector<std::string> argText = args;
    std::string program = VAULTORA_BINARY;
    std::vector<char*> argv{program.data()};
    for (std::string& a : argText) argv.push_back(a.data());
    argv.push_back(nullptr);
    int master = -1;
    const pid_t pid = forkpty(&master, nullptr, nullptr, nullptr);
    if (pid == 0) {
        setenv("HOME", home.path().c_str(), 1);
        setenv("XDG_CONFIG_HOME", (home / "config").c_str(), 1);
        setenv("XDG_RUNTIME_DIR", (home / "run").c_str(), 1);
        setenv("XDG_STATE_HOME", (home / "state").c_str(), 1);
        unsetenv("VAULTORA_PASSWORD_FILE");
        if (chdir(home.path().c_str()) != 0) _exit(127);
        execv(program.c_str(), argv.data());
        _exit(127);
    }
    if (pid < 0) return result;
    size_t step = 0, seenUpTo = 0;
    const auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(60);
    for (;;) {
        if (step < steps.size()) {
            const size_t at = result.screen.find(steps[step].waitFor, seenUpTo);
            if (at != std::string::npos) {
                seenUpTo = at + steps[step].waitFor.size();
                const std::string& typed = steps[step].send;
                if (write(master, typed.data(), typed.size()) != static_cast<ssize_t>(typed.size())) break;
                ++step;
                continue;
            }
        }
        pollfd p{master, POLLIN, 0};
        if (std::chrono::steady_clock::now() > deadline) {
            kill(pid, SIGKILL);
            break;
        }
        if (poll(&p, 1, 200) <= 0) continue;
        char buf[4096];
        const ssize_t n = read(master, buf, sizeof buf);
        if (n <= 0) break;  // the program ended and closed the terminal
        result.screen.append(buf, static_cast<size_t>(n));
    }
    int status = 0;
    if (waitpid(pid, &status, 0) == pid && WIFEXITED(status)) result.status = WEXITSTATUS(status);
    close(master);
    EXPECT_EQ(step, steps.size()) << "stopped waiting for: " << (step < steps.size() ? steps[step].waitFor : "")
                                  << "\nscreen:\n" << result.screen;
    return result;
}

TEST(TerminalProgram, PasswordsAreTypedWithoutEchoAndCheckedAsInTheDialog) {
    test::ProgramHome home;
    const std::string text = "alpha\n";
    ASSERT_TRUE(fs::writeWholeFile(home / "a.txt", text.data(), text.size()));

    TerminalRun r = runOnTerminal(home, {"Add", "t.vra", "a.txt"},
                                  {{"Password: ", "tiny\n"},
                                   {"Password length is too short", ""},
                                   {"Password: ", "secret-words-1\n"},
                                   {"Confirm password: ", "secret-words-2\n"},
                                   {"Passwords mismatch", ""},
                                   {"Password: ", "secret-words-1\n"},
                                   {"Confirm password: ", "secret-words-1\n"}});
    EXPECT_EQ(r.status, 0) << r.screen;
    EXPECT_NE(r.screen.find("Archive name: t.vra"), std::string::npos);
    EXPECT_EQ(r.screen.find("secret-words"), std::string::npos) << "password echoed:\n" << r.screen;
    EXPECT_EQ(r.screen.find("tiny"), std::string::npos);

    r = runOnTerminal(home, {"Extract", "t.vra", "out"},
                      {{"Password: ", "secret-words-2\n"},
                       {"The password you entered is invalid", ""},
                       {"Password: ", "secret-words-1\n"}});
    EXPECT_EQ(r.status, 0) << r.screen;
    std::vector<uint8_t> back;
    ASSERT_TRUE(fs::readWholeFile(home / "out/a.txt", back));
    EXPECT_EQ(std::string(back.begin(), back.end()), text);

    // Cancelling (end of input) gives 83.
    r = runOnTerminal(home, {"Extract", "t.vra", "out"}, {{"Password: ", "\x04"}});
    EXPECT_EQ(r.status, 83) << r.screen;
}

}  // namespace
}  // namespace vaultora
