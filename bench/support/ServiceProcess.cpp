// SPDX-License-Identifier: Apache-2.0
// Clients connect as soon as the socket exists, and use the wire protocol directly.
#include "support/ServiceProcess.h"

#include "foundation/cbor/Cbor.h"
#include "platform/linux/connection/FrameReader.h"
#include "support/SampleMessage.h"

#include <array>
#include <fmt/format.h>
#include <fstream>
#include <stdexcept>
#include <thread>

namespace bench {
namespace {

constexpr std::string_view socketName = "kesto";

} // namespace

ServiceProcess::ServiceProcess(const BenchOptions& options, std::string_view analytics, Build build,
                               const Extras& extras)
{
    const auto& root = directory_.path();
    std::vector<std::string> environment{fmt::format("KESTO_SERVICE_NAME={}", socketName)};
    for (const std::string_view name : {"RUNTIME", "STATE", "LOGS", "CONFIGURATION"}) {
        std::filesystem::create_directory(root / name);
        environment.push_back(fmt::format("{}_DIRECTORY={}", name, (root / name).native()));
    }
    std::ofstream(root / "CONFIGURATION" / "analytics.toml") << analytics << '\n';
    std::ofstream(root / "CONFIGURATION" / "device.toml")
        << "InternalBuild = " << (build == Build::Internal ? "true" : "false") << '\n';
    std::ofstream(root / "CONFIGURATION" / "feature-flags.toml") << extras.featureFlags;
    if (!extras.channelRoot.empty())
        environment.push_back(fmt::format("KESTO_CHANNEL_ROOT={}", extras.channelRoot.native()));
    process_ = ChildProcess::execute({options.service}, environment, root / "log");
}

std::filesystem::path ServiceProcess::socketPath() const
{
    return directory_.path() / "RUNTIME" / socketName;
}

void ServiceProcess::admitOtherUsers() const
{
    std::filesystem::permissions(directory_.path(), std::filesystem::perms::others_exec,
                                 std::filesystem::perm_options::add);
}

platform::FileDescriptor ServiceProcess::connect() const
{
    constexpr std::chrono::microseconds pause(50);
    constexpr std::chrono::seconds patience(10);
    for (const auto start = Clock::now(); Clock::now() - start < patience; std::this_thread::sleep_for(pause)) {
        if (auto socket = connectTo(socketPath()))
            return socket;
        if (process_.hasEnded())
            break;
    }
    std::ifstream log(directory_.path() / "log");
    throw std::runtime_error("the service does not run: " + std::string(std::istreambuf_iterator(log), {}));
}

platform::FileDescriptor ServiceProcess::connectWithSession() const
{
    auto socket = connect();
    const std::int64_t reporter = sampleReporterID;
    constexpr int longFormAudio = 7;
    writeAll(socket.get(), frame({1, 1, reporter}));
    writeAll(socket.get(), frame({2, 2, longFormAudio, reporter}));
    writeAll(socket.get(),
             frame({3, 4, foundation::Dictionary{{"HostApplicationDisplayID", "org.example.player"}}, reporter}));
    writeAll(socket.get(), frame({4, 5, reporter})); // answered when the session ends
    constexpr std::size_t answers = 3;
    std::array<char, answers * 8> bytes; // [call, null, true]
    if (!readAll(socket.get(), bytes.data(), bytes.size()))
        throw std::runtime_error("the service ended the connection");
    return socket;
}

RawClient ServiceProcess::makeClient() const
{
    return {connectWithSession(), Request::marked(sampleFrame(), std::endian::big), sampleAnswerSize};
}

std::string frame(const foundation::Array& call)
{
    std::string encoded;
    foundation::appendCbor(foundation::Value(call), encoded);
    std::string frame;
    platform::appendFrame(encoded, frame);
    return frame;
}

std::string sampleFrame()
{
    constexpr int sendMessage = 6;
    return frame({numberMark, sendMessage, sampleMessage(), sampleCategory, sampleType,
                  foundation::Array{foundation::Value(sampleReporterID)}});
}

} // namespace bench
