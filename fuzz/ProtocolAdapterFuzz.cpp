// SPDX-License-Identifier: Apache-2.0
// The content of a frame, as a call: for all bytes, either the adapter calls one operation and its answers go back
// under the call's number, or it refuses the call, calls no operation and sends no answer. The table of the operations
// says which. Afterwards no code holds the caller's connection.
//
// The input is one CBOR item.
#include "client/ServiceOperations.h"
#include "client/ServiceProtocolAdapter.h"
#include "foundation/cbor/Cbor.h"

#include <algorithm>
#include <cstdint>
#include <cstdlib>
#include <memory>
#include <span>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace {

using foundation::Array;
using foundation::Dictionary;
using foundation::Value;

void require(bool holds)
{
    if (!holds)
        std::abort();
}

// Answers every operation immediately, except killing, which is never answered.
class AnsweringProtocol final : public KestoReportingServiceProtocol {
public:
    void createReportingSession(std::int64_t, SuccessReply reply) override { answer(reply, true); }
    void setServiceType(AudioServiceType, std::int64_t, SuccessReply reply) override { answer(reply, true); }
    void getServiceNameForReporterID(std::int64_t, ServiceTypeReply reply) override
    {
        reply(turn, std::nullopt, AudioServiceTypeUnknown);
        answer(reply, AudioServiceTypeUnknown);
    }
    void setConfiguration(Dictionary configuration, std::int64_t, SuccessReply reply) override
    {
        static_cast<void>(configuration.size());
        answer(reply, false);
    }
    void startReportingSessionForID(std::int64_t, SuccessReply reply) override { answer(reply, true); }
    void sendMessage(Dictionary message, AudioEventCategory, std::uint16_t, std::optional<ReporterIDs> reporterIDs,
                     utility::Reply reply) override
    {
        ++calls;
        require(!reporterIDs || reporterIDs->size() <= client::mostReportersOfAMessage);
        reply(turn, message.empty() ? std::optional(utility::reportingDisabled) : std::nullopt);
    }
    void stopReportingSessionForID(std::int64_t, SuccessReply reply) override { answer(reply, true); }
    void destroyReportingSession(std::int64_t, SuccessReply reply) override { answer(reply, true); }
    void reporterID(std::int64_t reporterID, DictionaryReply valid) override
    {
        answer(valid, Dictionary{{"reporterID", reporterID}, {"serviceType", AudioServiceTypeUnknown}});
    }
    void getAllReporters(ReportersReply reply) override { answer(reply, ReporterIDs{1, -1}); }
    void killService(SuccessReply) override
    {
        ++calls;
        isKilled = true;
    }

    int calls = 0;
    bool isKilled = false;
    platform::Turn turn;

private:
    template <typename Reply, typename Result> void answer(const Reply& reply, const Result& result)
    {
        ++calls;
        reply(turn, std::nullopt, result);
    }
};

// Keeps the frames that are sent to the client.
class KeepingConnection final : public platform::Connection {
public:
    [[nodiscard]] std::int32_t processIdentifier() const override { return 1; }
    [[nodiscard]] std::uint32_t userIdentifier() const override { return 0; }
    [[nodiscard]] std::string description() const override { return "the fuzzer"; }
    void setCallHandler(CallHandler) override { }
    void setInterruptionHandler(EndHandler) override { }
    void setInvalidationHandler(EndHandler) override { }
    void setLane(std::shared_ptr<platform::Lane>, std::shared_ptr<ledger::Workload>) override { }
    void setLogShare(std::shared_ptr<platform::LogShare>) override { }
    void resume() override { }
    void send(platform::Turn&, std::string frame) override { sent.push_back(std::move(frame)); }
    void write(std::string) override { }

    std::vector<std::string> sent;
};

bool fits(client::OperationArgument argument, const Value& value)
{
    switch (argument) {
    case client::OperationArgument::ReporterID: return value.exactly<std::int64_t>().has_value();
    case client::OperationArgument::ServiceType:
    case client::OperationArgument::Type: return value.exactly<std::uint16_t>().has_value();
    case client::OperationArgument::Category: return value.exactly<std::uint32_t>().has_value();
    case client::OperationArgument::Configuration:
    case client::OperationArgument::Message: return value.dictionary().has_value();
    case client::OperationArgument::ReporterIDs: break;
    }
    const auto array = value.array();
    return array ? array->size() <= client::mostReportersOfAMessage
            && std::ranges::all_of(*array, [](const Value& id) { return id.exactly<std::int64_t>().has_value(); })
                 : value.isNull();
}

// The operation that the frame calls, or null if the frame is not a call.
const client::ServiceOperation* operationOf(std::span<const Value> frame)
{
    if (frame.size() < 2 || !frame[0].exactly<std::uint64_t>())
        return nullptr;
    const auto* operation = client::serviceOperationNumbered(frame[1].exactly<std::int64_t>().value_or(0));
    return operation != nullptr && std::ranges::equal(operation->arguments(), frame.subspan(2), fits) ? operation
                                                                                                      : nullptr;
}

void requireIsAnswerTo(const Array& call, std::string_view frame, client::OperationResult result)
{
    foundation::CborDecoder decoder;
    const auto answer = decoder.decode(frame)->array();
    const std::size_t size = result == client::OperationResult::None ? 2 : 3;
    require(answer && answer->size() == size && (*answer)[0] == call[0]);
    require((*answer)[1].isNull() || ((*answer)[1].array() && size == 2));
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size)
{
    static foundation::CborDecoder decoder; // as on a connection: it remembers keys and shapes from earlier frames
    const auto decoded = decoder.decode({reinterpret_cast<const char*>(data), size});
    const auto call = decoded ? decoded->array() : std::nullopt;
    if (!call)
        return 0; // the connection ends before there is a call

    const auto protocol = std::make_shared<AnsweringProtocol>();
    const auto connection = std::make_shared<KeepingConnection>();
    static ledger::Ledger ledger;
    client::ServiceProtocolAdapter adapter(protocol, ledger);
    const auto result = adapter.handleCall({*call, connection});

    const client::ServiceOperation* operation = operationOf(call->values());
    require(result.has_value() == (operation != nullptr));
    require(connection.use_count() == 1); // no code can answer later
    require(protocol->calls == (result ? 1 : 0));
    require(connection->sent.empty() == (!result || protocol->isKilled));
    require(result || !result.error().reason.empty());
    for (const std::string& frame : connection->sent)
        requireIsAnswerTo(*call, frame, operation->result());
    return 0;
}
