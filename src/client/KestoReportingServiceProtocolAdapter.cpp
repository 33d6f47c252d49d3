// One table lists the operations with the number of their arguments; the arguments are taken one by one, and the
// first that does not fit decides what is said about the call.
#include "client/KestoReportingServiceProtocolAdapter.h"

#include "foundation/cbor/Cbor.h"
#include "foundation/text/Format.h"

#include <array>
#include <limits>
#include <utility>

namespace {

using foundation::Array;
using foundation::Dictionary;
using foundation::Value;
using platform::Connection;

// Where the replies of one call go. Copies are held by whoever may answer; the last one lets the connection know
// that the call is done with.
class ReplyAddress {
public:
    ReplyAddress(std::shared_ptr<Connection> caller, std::uint64_t call) : caller_(std::move(caller)), call_(call) { }

    // [call, error, values...], the values appended by `appendValues`.
    template <typename AppendValues>
    void answer(const std::optional<KestoReportingError>& error, std::uint64_t valueCount,
                AppendValues appendValues) const
    {
        std::string frame;
        foundation::appendCborArrayHead(2 + valueCount, frame);
        foundation::appendCborInteger(call_, frame);
        if (error)
            foundation::appendCbor(Value(Array{Value(error->domain), Value(error->code)}), frame);
        else
            foundation::appendCborNull(frame);
        appendValues(frame);
        caller_->send(std::move(frame));
    }

    // A reply callback with one value, and one with none.
    template <typename Result> [[nodiscard]] KestoReportingResultReply<Result> withValue() &&
    {
        return [address = std::move(*this)](const std::optional<KestoReportingError>& error, Result result) {
            address.answer(error, 1, [&](std::string& frame) { foundation::appendCbor(Value(result), frame); });
        };
    }
    [[nodiscard]] KestoReportingReply withoutValue() &&
    {
        return [address = std::move(*this)](const std::optional<KestoReportingError>& error) {
            address.answer(error, 0, [](std::string&) { });
        };
    }

private:
    std::shared_ptr<Connection> caller_;
    std::uint64_t call_;
};

// Takes the arguments of one call in order. What does not fit is remembered, and what was taken then is not used.
class Arguments {
public:
    explicit Arguments(std::span<const Value> values) : rest_(values) { }

    template <typename Integer> Integer integer(std::string_view name)
    {
        const auto exact = next().exactly<Integer>();
        if (!exact)
            refuse(name,
                   foundation::format("an integer from {} to {}", std::numeric_limits<Integer>::min(),
                                      std::numeric_limits<Integer>::max()));
        return exact.value_or(0);
    }

    Dictionary dictionary(std::string_view name)
    {
        auto dictionary = next().dictionary();
        if (!dictionary)
            refuse(name, "a map");
        return std::move(dictionary).value_or(Dictionary());
    }

    std::optional<KestoReportingServiceProtocol::ReporterIDs> reporterIDs(std::string_view name)
    {
        constexpr std::size_t most = KestoReportingServiceProtocolAdapter::mostReportersOfAMessage;
        const Value& value = next();
        if (value.isNull())
            return std::nullopt;
        const auto array = value.array();
        if (!array)
            refuse(name, "an array or null");
        else if (array->size() > most)
            refuse(name, foundation::format("an array of at most {} elements", most));
        return array && !refusal_ ? integers(*array, name) : KestoReportingServiceProtocol::ReporterIDs();
    }

    [[nodiscard]] const std::optional<std::string>& refusal() const { return refusal_; }

private:
    KestoReportingServiceProtocol::ReporterIDs integers(const Array& array, std::string_view name)
    {
        KestoReportingServiceProtocol::ReporterIDs integers;
        integers.reserve(array.size());
        for (const Value& element : array) {
            const auto exact = element.exactly<std::int64_t>();
            if (!exact) {
                refuse(name, "an array of 64-bit integers");
                break;
            }
            integers.push_back(*exact);
        }
        return integers;
    }

    const Value& next()
    {
        const Value& value = rest_.front();
        rest_ = rest_.subspan(1);
        return value;
    }

    void refuse(std::string_view name, std::string_view expected)
    {
        if (!refusal_)
            refusal_ = foundation::format("argument {} is not {}", name, expected);
    }

    std::span<const Value> rest_;
    std::optional<std::string> refusal_;
};

using Protocol = KestoReportingServiceProtocol;
// Takes the arguments, and calls the operation unless one was refused.
using Operation = void (*)(Protocol&, Arguments&, ReplyAddress);

struct Method {
    std::string_view name;
    std::size_t argumentCount;
    Operation call;
};

// An operation whose only argument is a reporter ID.
template <typename Result>
using ReporterOperation = void (Protocol::*)(std::int64_t reporterID, KestoReportingResultReply<Result> reply);

template <typename Result, ReporterOperation<Result> operation>
void callWithReporterID(Protocol& protocol, Arguments& arguments, ReplyAddress reply)
{
    const auto reporterID = arguments.integer<std::int64_t>("reporter ID");
    if (!arguments.refusal())
        (protocol.*operation)(reporterID, std::move(reply).template withValue<Result>());
}

constexpr std::array<Method, 11> methods{{
    {"createReportingSession", 1, callWithReporterID<bool, &Protocol::createReportingSession>},
    {"setServiceType", 2,
     [](Protocol& protocol, Arguments& arguments, ReplyAddress reply) {
         const auto serviceType = arguments.integer<AudioServiceType>("service type");
         const auto reporterID = arguments.integer<std::int64_t>("reporter ID");
         if (!arguments.refusal())
             protocol.setServiceType(serviceType, reporterID, std::move(reply).withValue<bool>());
     }},
    {"getServiceNameForReporterID", 1, callWithReporterID<AudioServiceType, &Protocol::getServiceNameForReporterID>},
    {"setConfiguration", 2,
     [](Protocol& protocol, Arguments& arguments, ReplyAddress reply) {
         auto configuration = arguments.dictionary("configuration");
         const auto reporterID = arguments.integer<std::int64_t>("reporter ID");
         if (!arguments.refusal())
             protocol.setConfiguration(std::move(configuration), reporterID, std::move(reply).withValue<bool>());
     }},
    {"startReportingSessionForID", 1, callWithReporterID<bool, &Protocol::startReportingSessionForID>},
    {"sendMessage", 4,
     [](Protocol& protocol, Arguments& arguments, ReplyAddress reply) {
         auto message = arguments.dictionary("message");
         const auto category = arguments.integer<AudioEventCategory>("category");
         const auto type = arguments.integer<std::uint16_t>("type");
         auto reporterIDs = arguments.reporterIDs("reporter IDs");
         if (!arguments.refusal())
             protocol.sendMessage(std::move(message), category, type, std::move(reporterIDs),
                                  std::move(reply).withoutValue());
     }},
    {"stopReportingSessionForID", 1, callWithReporterID<bool, &Protocol::stopReportingSessionForID>},
    {"destroyReportingSession", 1, callWithReporterID<bool, &Protocol::destroyReportingSession>},
    {"reporterID", 1, callWithReporterID<const Dictionary&, &Protocol::reporterID>},
    {"getAllReporters", 0,
     [](Protocol& protocol, Arguments&, ReplyAddress reply) {
         protocol.getAllReporters(std::move(reply).withValue<const Array&>());
     }},
    {"killService", 0,
     [](Protocol& protocol, Arguments&, ReplyAddress reply) {
         protocol.killService(std::move(reply).withValue<bool>());
     }},
}};

std::unexpected<Connection::Violation> violation(std::string reason)
{
    return std::unexpected(Connection::Violation{std::move(reason)});
}

} // namespace

std::expected<void, Connection::Violation> KestoReportingServiceProtocolAdapter::handleCall(Connection::Call call)
{
    constexpr std::size_t headCount = 2; // the call's number and the method's
    const std::span<const Value> values = call.frame.values();
    if (values.size() < headCount)
        return violation("a call is an array of a number, a method and its arguments");
    const auto callNumber = values[0].exactly<std::uint64_t>();
    if (!callNumber)
        return violation("a call's number is an unsigned 64-bit integer");
    const auto methodNumber = values[1].exactly<std::int64_t>();
    if (!methodNumber) // not repeated to the log, where it could fill a disk or forge lines
        return violation(foundation::format("a call's method is an integer from 1 to {}", methods.size()));
    if (*methodNumber < 1 || std::cmp_greater(*methodNumber, methods.size()))
        return violation(foundation::format("unknown method {}; there are 1 to {}", *methodNumber, methods.size()));
    const Method& method = methods[static_cast<std::size_t>(*methodNumber) - 1];
    if (values.size() - headCount != method.argumentCount)
        return violation(foundation::format("{} takes {} arguments, not {}", method.name, method.argumentCount,
                                            values.size() - headCount));

    Arguments arguments(values.subspan(headCount));
    method.call(*exportedObject_, arguments, ReplyAddress(std::move(call.caller), *callNumber));
    if (arguments.refusal())
        return violation(foundation::format("{}: {}", method.name, *arguments.refusal()));
    return {};
}
