// SPDX-License-Identifier: Apache-2.0
// A real PipeWire of a test's own, and programs that play and record on it.
#pragma once

#include "support/TemporaryDirectory.h"

#include <sys/types.h>

#include <map>
#include <memory>
#include <string>
#include <vector>

namespace kesto_pipewire {

// A program that runs until this object ends it. Its standard input is a pipe from the test, its output can be read,
// and its standard error is the test's.
class Program {
public:
    using Environment = std::map<std::string, std::string>; // in addition to the test's own

    // The first argument is the program, searched for in PATH.
    Program(const std::vector<std::string>& arguments, const Environment& environment);
    ~Program(); // by SIGTERM
    Program(const Program&) = delete;
    Program& operator=(const Program&) = delete;

    void write(const std::string& text) const;
    // The next line of its output, or an empty one if the output has ended or none comes for too long.
    [[nodiscard]] std::string readLine() const;
    void kill(int signal) const;
    void closeInput();
    // Waits for the program to end without a signal from the test. Returns its exit status, or 128 and its signal's
    // number.
    int wait();
    [[nodiscard]] pid_t pid() const noexcept { return pid_; }

private:
    pid_t pid_ = -1;
    int input_ = -1;
    int output_ = -1;
};

// Runs one private instance at a time, always at the same place.
class HeadlessPipeWire {
public:
    HeadlessPipeWire();
    ~HeadlessPipeWire();
    HeadlessPipeWire(const HeadlessPipeWire&) = delete;
    HeadlessPipeWire& operator=(const HeadlessPipeWire&) = delete;

    // The reason if it cannot run here, such as missing programs; else empty.
    [[nodiscard]] const std::string& reasonToSkip() const noexcept { return reasonToSkip_; }

    void start(); // after a former instance has been cleared away
    void kill() const; // PipeWire itself, without warning
    void clearAway(); // removes the rest
    [[nodiscard]] std::string socket() const;
    [[nodiscard]] Program::Environment environment() const;

    [[nodiscard]] std::unique_ptr<Program> run(const std::vector<std::string>& arguments) const;
    // Runs it to its end; its whole output. An exit status other than 0 fails the test.
    std::string runToEnd(const std::vector<std::string>& arguments) const;

    // Players and recorders. The tone player obeys "pause\n" and "play\n".
    [[nodiscard]] std::unique_ptr<Program> playTone(const std::string& role) const;
    // A program without links, whose ports are "tone-filter:output_1", "tone-filter:input_1" and so on.
    [[nodiscard]] std::unique_ptr<Program> runFilter(int outputs, int inputs) const;
    // Links two ports as soon as both exist, unless they are linked.
    void link(const std::string& output, const std::string& input) const;
    void unlink(const std::string& output, const std::string& input) const;
    // A virtual device and the stream to which it passes its sound, in a program of their own: the sink
    // "chain-input" with the stream "chain-output", which plays on a device, or the source "chain-output" with the
    // stream "chain-input", which records from one.
    [[nodiscard]] std::unique_ptr<Program> runChain(const std::string& deviceClass) const;
    [[nodiscard]] std::unique_ptr<Program> playOverPulse(const std::string& role,
                                                         const std::string& device = "@DEFAULT_SINK@") const;
    [[nodiscard]] std::unique_ptr<Program> record() const;

    // PulseAudio's number of the playing stream, by which `pactl` names it. Exactly one stream must play.
    [[nodiscard]] std::string onlySinkInput() const;

private:
    const support::TemporaryDirectory directory_;
    std::unique_ptr<Program> instance_;
    pid_t server_ = -1;
    std::string reasonToSkip_;
};

} // namespace kesto_pipewire
