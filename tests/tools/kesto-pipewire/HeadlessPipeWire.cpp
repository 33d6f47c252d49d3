// SPDX-License-Identifier: Apache-2.0
// The headless-pipewire script does the work; this file starts and ends it.
#include "tools/kesto-pipewire/HeadlessPipeWire.h"

#include <gtest/gtest.h>

#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstdlib>
#include <stdexcept>
#include <system_error>
#include <utility>

namespace kesto_pipewire {

namespace {

constexpr int longestSilence = 20'000; // milliseconds
constexpr int exitSkip = 77; // of headless-pipewire, when programs are not installed

struct ProgramPipe {
    ProgramPipe()
    {
        if (::pipe2(ends.data(), O_CLOEXEC) != 0)
            throw std::system_error(errno, std::generic_category(), "pipe");
    }
    std::array<int, 2> ends{}; // to read from, to write to
};

std::vector<std::string> mergedEnvironment(const Program::Environment& additions)
{
    std::vector<std::string> merged;
    for (char** entry = environ; *entry; ++entry) {
        const std::string text(*entry);
        if (!additions.contains(text.substr(0, text.find('='))))
            merged.push_back(text);
    }
    for (const auto& [name, value] : additions)
        merged.push_back(name + "=" + value);
    return merged;
}

std::vector<char*> pointers(std::vector<std::string>& texts)
{
    std::vector<char*> result;
    for (auto& text : texts)
        result.push_back(text.data());
    result.push_back(nullptr);
    return result;
}

} // namespace

Program::Program(const std::vector<std::string>& arguments, const Environment& environment)
{
    const ProgramPipe input;
    const ProgramPipe output;
    posix_spawn_file_actions_t actions;
    posix_spawn_file_actions_init(&actions);
    posix_spawn_file_actions_adddup2(&actions, input.ends[0], STDIN_FILENO);
    posix_spawn_file_actions_adddup2(&actions, output.ends[1], STDOUT_FILENO);
    posix_spawnattr_t attributes; // the loop has signals blocked, which its children must not inherit
    sigset_t none;
    sigemptyset(&none);
    posix_spawnattr_init(&attributes);
    posix_spawnattr_setsigmask(&attributes, &none);
    posix_spawnattr_setflags(&attributes, POSIX_SPAWN_SETSIGMASK);

    auto argumentTexts = arguments;
    auto environmentTexts = mergedEnvironment(environment);
    const auto error = ::posix_spawnp(&pid_, arguments[0].c_str(), &actions, &attributes,
                                      pointers(argumentTexts).data(), pointers(environmentTexts).data());
    posix_spawnattr_destroy(&attributes);
    posix_spawn_file_actions_destroy(&actions);
    ::close(input.ends[0]);
    ::close(output.ends[1]);
    input_ = input.ends[1];
    output_ = output.ends[0];
    if (error != 0)
        throw std::system_error(error, std::generic_category(), arguments[0]);
}

Program::~Program()
{
    kill(SIGCONT); // first: a program that ends is stopped by its leak check, which would never see it stop
    closeInput();
    kill(SIGTERM);
    wait();
    ::close(output_);
}

void Program::write(const std::string& text) const
{
    ASSERT_EQ(::write(input_, text.data(), text.size()), static_cast<ssize_t>(text.size()));
}

std::string Program::readLine() const
{
    std::string line;
    pollfd readable{output_, POLLIN, 0};
    for (char character = 0; ::poll(&readable, 1, longestSilence) == 1 && ::read(output_, &character, 1) == 1;) {
        if (character == '\n')
            break;
        line += character;
    }
    return line;
}

void Program::kill(int signal) const
{
    if (pid_ > 0)
        ::kill(pid_, signal);
}

void Program::closeInput()
{
    if (const auto descriptor = std::exchange(input_, -1); descriptor >= 0)
        ::close(descriptor);
}

int Program::wait()
{
    const auto pid = std::exchange(pid_, -1);
    int status = 0;
    if (pid < 0 || ::waitpid(pid, &status, 0) != pid)
        return -1;
    return WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
}

HeadlessPipeWire::HeadlessPipeWire()
{
    start();
}

HeadlessPipeWire::~HeadlessPipeWire()
{
    clearAway();
}

// The script runs a shell that reports that PipeWire is ready and then waits for the end of its standard input, so that
// no process is left, even if the test is killed.
void HeadlessPipeWire::start()
{
    instance_ =
        std::make_unique<Program>(std::vector<std::string>{HEADLESS_PIPEWIRE, "--in", directory_.path(), "sh", "-c",
                                                           "echo $HEADLESS_PIPEWIRE_PID; exec cat >/dev/null"},
                                  Program::Environment{});
    const auto line = instance_->readLine();
    if (!line.empty()) {
        server_ = std::stoi(line);
        return;
    }
    instance_->closeInput();
    if (const auto status = instance_->wait(); status == exitSkip)
        reasonToSkip_ = "PipeWire's programs are not installed";
    else
        throw std::runtime_error("no private PipeWire, status " + std::to_string(status));
}

void HeadlessPipeWire::kill() const
{
    ::kill(server_, SIGKILL);
}

void HeadlessPipeWire::clearAway()
{
    if (!instance_)
        return;
    instance_->closeInput();
    instance_->wait();
    instance_.reset();
}

std::string HeadlessPipeWire::socket() const
{
    return directory_ / "run/pipewire-0";
}

Program::Environment HeadlessPipeWire::environment() const
{
    return {{"HOME", directory_.path()},
            {"XDG_RUNTIME_DIR", directory_ / "run"},
            {"XDG_CONFIG_HOME", directory_ / "config"},
            {"PIPEWIRE_REMOTE", socket()},
            {"PULSE_SERVER", "unix:" + (directory_ / "run/pulse/native").string()}};
}

std::unique_ptr<Program> HeadlessPipeWire::run(const std::vector<std::string>& arguments) const
{
    return std::make_unique<Program>(arguments, environment());
}

std::string HeadlessPipeWire::runToEnd(const std::vector<std::string>& arguments) const
{
    const auto program = run(arguments);
    std::string output;
    for (auto line = program->readLine(); !line.empty(); line = program->readLine())
        output += line + "\n";
    EXPECT_EQ(program->wait(), 0) << arguments[0] << " " << arguments[1] << " said: " << output;
    return output;
}

std::unique_ptr<Program> HeadlessPipeWire::playTone(const std::string& role) const
{
    return run({TONE_PLAYER, role});
}

std::unique_ptr<Program> HeadlessPipeWire::runFilter(int outputs, int inputs) const
{
    return run({TONE_FILTER, std::to_string(outputs), std::to_string(inputs)});
}

void HeadlessPipeWire::link(const std::string& output, const std::string& input) const
{
    runToEnd({"sh", "-c",
              "for turn in $(seq 300); do said=$(pw-link \"$0\" \"$1\" 2>&1) && exit 0;"
              " case $said in *exists) exit 0;; esac; sleep 0.01; done; echo \"$said: $0 $1\"; pw-link -io; exit 1",
              output, input});
}

void HeadlessPipeWire::unlink(const std::string& output, const std::string& input) const
{
    runToEnd({"pw-link", "-d", output, input});
}

std::unique_ptr<Program> HeadlessPipeWire::runChain(const std::string& deviceClass) const
{
    const bool isSink = deviceClass == "Audio/Sink";
    const auto properties = [&](const std::string& end, bool isDevice) {
        return "--" + end + "-props={ node.name = chain-" + (end == "capture" ? "input" : "output")
            + (isDevice ? " media.class = " + deviceClass : "") + (isSink ? " }" : " stream.capture.sink = true }");
    };
    return run({"pw-loopback", properties("capture", isSink), properties("playback", !isSink)});
}

std::unique_ptr<Program> HeadlessPipeWire::playOverPulse(const std::string& role, const std::string& device) const
{
    return run({"sh", "-c",
                "exec pacat --playback --raw --device=" + device + " --property=media.role=" + role + " </dev/zero"});
}

std::unique_ptr<Program> HeadlessPipeWire::record() const
{
    return run({"sh", "-c", "exec pacat --record --raw --latency-msec=50 --device=null-sink.monitor >/dev/null"});
}

std::string HeadlessPipeWire::onlySinkInput() const
{
    const auto list = runToEnd({"pactl", "list", "short", "sink-inputs"});
    EXPECT_EQ(std::count(list.begin(), list.end(), '\n'), 1) << list;
    return list.substr(0, list.find('\t'));
}

} // namespace kesto_pipewire
