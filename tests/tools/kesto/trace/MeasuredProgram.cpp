// SPDX-License-Identifier: Apache-2.0
// A program to be measured: emits so many pairs of events, prints its arguments, and ends with the given status.
//
//     kesto_measured_program COUNT STATUS [WORD...]
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <kesto/trace.hpp>
#include <thread>

int main(int argumentCount, char** arguments)
{
    constexpr std::chrono::seconds patience(20);
    if (argumentCount < 3)
        return EXIT_FAILURE;
    kesto::Options options;
    options.trace = true;
    kesto::Client client;
    if (client.open(options) != kesto::Status::Ok)
        return EXIT_FAILURE;
    const kesto::Tracer tracer(client);
    const auto end = std::chrono::steady_clock::now() + patience;
    while (!tracer.isActive() && std::chrono::steady_clock::now() < end)
        std::this_thread::sleep_for(std::chrono::milliseconds(1));
    for (int count = std::atoi(arguments[1]); count > 0; --count) {
        const kesto::TraceInterval interval(tracer, 0x21040010, 0x21040014);
        std::this_thread::sleep_for(std::chrono::microseconds(200));
    }
    for (int index = 3; index < argumentCount; ++index)
        std::printf("<%s>", arguments[index]);
    std::printf("\n");
    return std::atoi(arguments[2]);
}
