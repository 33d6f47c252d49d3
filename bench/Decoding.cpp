// SPDX-License-Identifier: Apache-2.0
// Two steps of a message's path that have peers of their own: decoding CBOR compared with libcbor, and keeping a
// payload compared with a list of byte strings.
#include "Groups.h"
#include "foundation/cbor/Cbor.h"
#include "session/MessageStore.h"
#include "support/InProcessPlatform.h"
#include "support/SampleMessage.h"

#include <cbor.h>
#include <fmt/format.h>
#include <stdexcept>

namespace bench {
namespace {

constexpr std::size_t decodedEach = 20'000;

std::string encodedSample()
{
    std::string encoded;
    foundation::appendCbor(sampleMessage(), encoded);
    return encoded;
}

const unsigned char* bytesOf(const std::string& text)
{
    return reinterpret_cast<const unsigned char*>(text.data());
}

double costOfDecoder(const std::string& encoded)
{
    foundation::CborDecoder decoder;
    return nanosecondsEach(decodedEach, [&](std::size_t) {
        const auto value = decoder.decode(encoded);
        if (!value)
            throw std::runtime_error("the sample cannot be decoded");
        use(value);
    });
}

// Visits every item without building values.
double costOfStreaming(const std::string& encoded)
{
    return nanosecondsEach(decodedEach, [&](std::size_t) {
        for (std::size_t at = 0; at < encoded.size();) {
            const auto result =
                ::cbor_stream_decode(bytesOf(encoded) + at, encoded.size() - at, &cbor_empty_callbacks, nullptr);
            if (result.status != CBOR_DECODER_FINISHED)
                throw std::runtime_error("libcbor cannot decode the sample");
            at += result.read;
        }
    });
}

double costOfTree(const std::string& encoded)
{
    return nanosecondsEach(decodedEach, [&](std::size_t) {
        cbor_load_result result;
        cbor_item_t* item = ::cbor_load(bytesOf(encoded), encoded.size(), &result);
        if (item == nullptr)
            throw std::runtime_error("libcbor cannot decode the sample");
        use(item);
        ::cbor_decref(&item);
    });
}

constexpr std::size_t keptEach = 20'000;

double costOfStore(const std::vector<foundation::Dictionary>& messages)
{
    session::MessageStore store(session::StorageBudget::service());
    return nanosecondsEach(messages.size(),
                           [&](std::size_t each) { (void)store.record(sampleCategory, sampleType, messages[each]); });
}

double costOfList(const std::vector<foundation::Dictionary>& messages)
{
    std::vector<std::string> list;
    return nanosecondsEach(messages.size(), [&](std::size_t each) {
        std::string encoded;
        foundation::appendCbor(messages[each], encoded);
        list.push_back(std::move(encoded));
    });
}

} // namespace

void measureDecoding(const BenchOptions& options, Report& report)
{
    const InProcessPlatform platform;
    const std::string encoded = encodedSample();
    const auto decoding = compete(
        options, "decoding", [&] { return costOfDecoder(encoded); }, [&] { return costOfStreaming(encoded); },
        [&] { return costOfTree(encoded); });
    const std::string what = fmt::format("decoding the message, {} B of CBOR", encoded.size());
    report.add({what, "ns", decoding[0], PeerFigure{"libcbor, tree", decoding[2]}});
    report.add({what, "ns", decoding[0], PeerFigure{"libcbor, stream, builds nothing", decoding[1]}});

    std::vector<foundation::Dictionary> messages;
    for (std::uint32_t each = 1; each <= keptEach; ++each)
        messages.push_back(sampleMessage(numberMark + each));
    const auto keeping =
        compete(options, "keeping", [&] { return costOfStore(messages); }, [&] { return costOfList(messages); });
    report.add({"keeping a payload that was compared", "ns", keeping[0],
                PeerFigure{"encoded into a list of strings", keeping[1]}});
}

} // namespace bench
