// What stands in a frame, as a call: whatever a client sends, either one operation is called and its answers go back
// under the call's number, or the call is refused, and then nothing was called and nothing is answered. Nobody holds
// the caller's connection afterwards.
//
// The input is one CBOR item.
#include "client/KestoReportingServiceProtocolAdapter.h"
#include "foundation/cbor/Cbor.h"

#include <cstdint>
#include <cstdlib>
#include <memory>
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

// Answers every operation at once, with one that may be answered so; killing is never answered.
class AnsweringProtocol final : public KestoReportingServiceProtocol {
public:
    void createReportingSession(std::int64_t, SuccessReply reply) override { answer(reply, true); }
    void setServiceType(AudioServiceType, std::int64_t, SuccessReply reply) override { answer(reply, true); }
    void getServiceNameForReporterID(std::int64_t, ServiceTypeReply reply) override
    {
        reply(std::nullopt, AudioServiceTypeUnknown);
        answer(reply, AudioServiceTypeUnknown);
    }
    void setConfiguration(Dictionary configuration, std::int64_t, SuccessReply reply) override
    {
        static_cast<void>(configuration.size());
        answer(reply, false);
    }
    void startReportingSessionForID(std::int64_t, SuccessReply reply) override { answer(reply, true); }
    void sendMessage(Dictionary message, AudioEventCategory, std::uint16_t, std::optional<ReporterIDs> reporterIDs,
                     KestoReportingReply reply) override
    {
        ++calls;
        require(!reporterIDs || reporterIDs->size() <= KestoReportingServiceProtocolAdapter::mostReportersOfAMessage);
        reply(message.empty() ? std::optional(KestoReportingErrorDisabled) : std::nullopt);
    }
    void stopReportingSessionForID(std::int64_t, SuccessReply reply) override { answer(reply, true); }
    void destroyReportingSession(std::int64_t, SuccessReply reply) override { answer(reply, true); }
    void reporterID(std::int64_t reporterID, DictionaryReply valid) override
    {
        answer(valid, Dictionary{{"reporterID", reporterID}, {"serviceType", AudioServiceTypeUnknown}});
    }
    void getAllReporters(ArrayReply reply) override { answer(reply, Array{1, -1}); }
    void killService(SuccessReply) override
    {
        ++calls;
        isKilled = true;
    }

    int calls = 0;
    bool isKilled = false;

private:
    template <typename Reply, typename Result> void answer(const Reply& reply, const Result& result)
    {
        ++calls;
        reply(std::nullopt, result);
    }
};

// Keeps the frames that are sent to the client.
class KeepingConnection final : public platform::Connection {
public:
    [[nodiscard]] std::int32_t processIdentifier() const override { return 1; }
    [[nodiscard]] std::string description() const override { return "the fuzzer"; }
    void setCallHandler(CallHandler) override { }
    void setInterruptionHandler(EndHandler) override { }
    void setInvalidationHandler(EndHandler) override { }
    void resume() override { }
    void send(std::string frame) override { sent.push_back(std::move(frame)); }

    std::vector<std::string> sent;
};

void requireIsAnswerTo(const Array& call, std::string_view frame)
{
    foundation::CborDecoder decoder;
    const auto answer = decoder.decode(frame)->array();
    require(answer && answer->size() >= 2 && (*answer)[0] == call[0]);
    require((*answer)[1].isNull() || ((*answer)[1].array() && answer->size() == 2));
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
    KestoReportingServiceProtocolAdapter adapter(protocol);
    const auto result = adapter.handleCall({*call, connection});

    require(connection.use_count() == 1); // nobody answers later
    require(protocol->calls == (result ? 1 : 0));
    require(connection->sent.empty() == (!result || protocol->isKilled));
    require(result || !result.error().reason.empty());
    for (const std::string& frame : connection->sent)
        requireIsAnswerTo(*call, frame);
    return 0;
}
