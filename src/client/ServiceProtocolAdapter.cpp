// SPDX-License-Identifier: Apache-2.0
// The table of the operations says which arguments a call has; the parameters of the operation's function say which
// types they become. The arguments are taken one by one; the first wrong one decides what the log says about the call.
#include "client/ServiceProtocolAdapter.h"

#include "client/ServiceOperations.h"
#include "foundation/cbor/Cbor.h"
#include "foundation/text/Format.h"

#include <array>
#include <limits>
#include <tuple>
#include <type_traits>
#include <utility>

namespace client {

namespace {

using foundation::Array;
using foundation::Dictionary;
using foundation::Value;
using platform::Connection;

// Where the replies of one call go. Everything that may reply holds a copy; when the last copy goes, the connection
// knows that the call is finished.
class ReplyAddress {
public:
    ReplyAddress(std::shared_ptr<Connection> caller, std::uint64_t call) : caller_(std::move(caller)), call_(call) { }

    // Sends [call, error, values...].
    template <typename... Values>
    void operator()(platform::Turn& turn, const std::optional<utility::ReplyError>& error,
                    const Values&... values) const
    {
        std::string frame;
        foundation::appendCborArrayHead(2 + sizeof...(values), frame);
        foundation::appendCborInteger(call_, frame);
        if (error)
            foundation::appendCbor(Value(Array{Value(error->domain), Value(error->code)}), frame);
        else
            foundation::appendCborNull(frame);
        (append(values, frame), ...);
        caller_->send(turn, std::move(frame));
    }

private:
    template <typename Result> static void append(const Result& value, std::string& frame)
    {
        foundation::appendCbor(Value(value), frame);
    }
    static void append(const KestoReportingServiceProtocol::ReporterIDs& reporterIDs, std::string& frame)
    {
        foundation::appendCborArray(reporterIDs, frame); // there may be a hundred thousand
    }

    std::shared_ptr<Connection> caller_;
    std::uint64_t call_;
};

std::string_view nameOf(OperationArgument argument)
{
    switch (argument) {
    case OperationArgument::ReporterID: return "reporter ID";
    case OperationArgument::ServiceType: return "service type";
    case OperationArgument::Configuration: return "configuration";
    case OperationArgument::Message: return "message";
    case OperationArgument::Category: return "category";
    case OperationArgument::Type: return "type";
    case OperationArgument::ReporterIDs: return "reporter IDs";
    }
    return {};
}

// Gives each parameter of an operation its argument of the call, in order, and the last one the reply. It remembers the
// first wrong argument; the caller then does not use what was taken.
class Arguments {
public:
    using ReporterIDs = KestoReportingServiceProtocol::ReporterIDs;

    // There are as many values as names.
    Arguments(std::span<const OperationArgument> names, std::span<const Value> values, ReplyAddress reply)
        : names_(names),
          values_(values),
          reply_(std::move(reply))
    {
    }

    template <typename Parameter> void take(Parameter& parameter)
    {
        read(parameter);
        ++taken_;
    }

    [[nodiscard]] const std::optional<std::string>& refusal() const { return refusal_; }

private:
    template <std::integral Integer> void read(Integer& integer)
    {
        const auto exact = value().exactly<Integer>();
        if (!exact)
            refuse(foundation::format("an integer from {} to {}", std::numeric_limits<Integer>::min(),
                                      std::numeric_limits<Integer>::max()));
        integer = exact.value_or(0);
    }

    void read(Dictionary& dictionary)
    {
        auto given = value().dictionary();
        if (!given)
            refuse("a map");
        dictionary = std::move(given).value_or(Dictionary());
    }

    void read(std::optional<ReporterIDs>& reporterIDs)
    {
        constexpr std::size_t most = mostReportersOfAMessage;
        const auto array = value().array();
        if (!array && !value().isNull())
            refuse("an array or null");
        else if (array && array->size() > most)
            refuse(foundation::format("an array of at most {} elements", most));
        if (array && !refusal_)
            reporterIDs = integers(*array);
    }

    template <typename... Results>
    void read(std::function<void(platform::Turn&, const std::optional<utility::ReplyError>&, Results...)>& reply)
    {
        reply = std::move(reply_);
    }

    ReporterIDs integers(const Array& array)
    {
        ReporterIDs integers;
        integers.reserve(array.size());
        for (const Value& element : array) {
            const auto exact = element.exactly<std::int64_t>();
            if (!exact) {
                refuse("an array of 64-bit integers");
                break;
            }
            integers.push_back(*exact);
        }
        return integers;
    }

    [[nodiscard]] const Value& value() const { return values_[taken_]; }

    void refuse(std::string_view expected)
    {
        if (!refusal_)
            refusal_ = foundation::format("argument {} is not {}", nameOf(names_[taken_]), expected);
    }

    std::span<const OperationArgument> names_;
    std::span<const Value> values_;
    ReplyAddress reply_;
    std::size_t taken_ = 0;
    std::optional<std::string> refusal_;
};

using Protocol = KestoReportingServiceProtocol;
// Takes the parameters, and calls the operation unless an argument was wrong.
template <typename... Parameters>
void callWith(Arguments& arguments, Protocol& protocol, void (Protocol::*operation)(Parameters...))
{
    std::tuple<Parameters...> parameters;
    std::apply(
        [&](Parameters&... each) {
            (arguments.take(each), ...);
            if (!arguments.refusal())
                (protocol.*operation)(std::move(each)...);
        },
        parameters);
}

using Call = void (*)(Arguments&, Protocol&);

// How each operation is called.
constexpr auto calls = []<std::size_t... places>(std::index_sequence<places...>) {
    return std::array<Call, sizeof...(places)>{[](Arguments& arguments, Protocol& protocol) {
        callWith(arguments, protocol, std::get<places>(serviceProtocolFunctions));
    }...};
}(std::make_index_sequence<serviceOperations.size()>());

// Whether the parameter can hold every value of the argument.
template <typename Parameter> constexpr bool holds(OperationArgument argument)
{
    switch (argument) {
    case OperationArgument::ReporterID: return std::is_same_v<Parameter, std::int64_t>;
    case OperationArgument::ServiceType:
    case OperationArgument::Type: return std::is_same_v<Parameter, std::uint16_t>;
    case OperationArgument::Category: return std::is_same_v<Parameter, std::uint32_t>;
    case OperationArgument::Configuration:
    case OperationArgument::Message: return std::is_same_v<Parameter, Dictionary>;
    case OperationArgument::ReporterIDs:
        return std::is_same_v<Parameter, std::optional<KestoReportingServiceProtocol::ReporterIDs>>;
    }
    return false;
}

// Whether the reply carries the result.
template <typename Reply> constexpr bool brings(OperationResult result)
{
    switch (result) {
    case OperationResult::None: return std::is_same_v<Reply, utility::Reply>;
    case OperationResult::Success: return std::is_same_v<Reply, Protocol::SuccessReply>;
    case OperationResult::ServiceType: return std::is_same_v<Reply, Protocol::ServiceTypeReply>;
    case OperationResult::Validity: return std::is_same_v<Reply, Protocol::DictionaryReply>;
    case OperationResult::ReporterIDs: return std::is_same_v<Reply, Protocol::ReportersReply>;
    }
    return false;
}

template <typename... Parameters>
consteval bool isDeclaredAs(const ServiceOperation& operation, void (Protocol::*)(Parameters...))
{
    const auto arguments = operation.arguments();
    std::size_t place = 0;
    const auto fits = [&]<typename Parameter>(std::type_identity<Parameter>) {
        return place == arguments.size() ? brings<Parameter>(operation.result()) : holds<Parameter>(arguments[place++]);
    };
    return sizeof...(Parameters) == arguments.size() + 1 && (fits(std::type_identity<Parameters>()) && ...);
}
static_assert(
    []<std::size_t... places>(std::index_sequence<places...>) {
        return (isDeclaredAs(serviceOperations[places], std::get<places>(serviceProtocolFunctions)) && ...);
    }(std::make_index_sequence<std::tuple_size_v<decltype(serviceProtocolFunctions)>>()),
    "the protocol declares an operation otherwise than the table of the operations");

// The ledger's counters of calls stand in the order of the operations' numbers.
constexpr ledger::Counter counterOfCalls(std::int64_t method)
{
    constexpr auto first = static_cast<std::int64_t>(ledger::Counter::CallsCreateReportingSession);
    static_assert(static_cast<std::size_t>(ledger::Counter::CallsKillService) == first + serviceOperations.size() - 1);
    return static_cast<ledger::Counter>(first + method - 1);
}

std::unexpected<Connection::Violation> violation(std::string reason)
{
    return std::unexpected(Connection::Violation{std::move(reason)});
}

} // namespace

std::expected<void, Connection::Violation> ServiceProtocolAdapter::handleCall(Connection::Call call)
{
    constexpr std::size_t headCount = 2; // the call's number and the method's
    const std::span<const Value> values = call.frame.values();
    if (values.size() < headCount)
        return violation("a call is an array of a number, a method and its arguments");
    const auto callNumber = values[0].exactly<std::uint64_t>();
    if (!callNumber)
        return violation("a call's number is an unsigned 64-bit integer");
    const auto methodNumber = values[1].exactly<std::int64_t>();
    constexpr std::size_t methodCount = serviceOperations.size();
    if (!methodNumber) // not repeated in the log, where it could fill the disk or forge lines
        return violation(foundation::format("a call's method is an integer from 1 to {}", methodCount));
    const ServiceOperation* operation = serviceOperationNumbered(*methodNumber);
    if (operation == nullptr)
        return violation(foundation::format("unknown method {}; there are 1 to {}", *methodNumber, methodCount));
    const auto given = values.subspan(headCount);
    if (given.size() != operation->arguments().size())
        return violation(foundation::format("{} takes {} arguments, not {}", operation->name(),
                                            operation->arguments().size(), given.size()));

    ledger_.get().count(counterOfCalls(*methodNumber));
    Arguments arguments(operation->arguments(), given, ReplyAddress(std::move(call.caller), *callNumber));
    calls[static_cast<std::size_t>(*methodNumber) - 1](arguments, *exportedObject_);
    if (arguments.refusal())
        return violation(foundation::format("{}: {}", operation->name(), *arguments.refusal()));
    return {};
}

} // namespace client
