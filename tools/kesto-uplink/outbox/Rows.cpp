// SPDX-License-Identifier: Apache-2.0
// Every row begins with its key in the fleet's database: the device, the epoch, the kind and the ID.
#include "kesto-uplink/outbox/Rows.h"

#include "foundation/values/Json.h"
#include "kesto/files/JsonReader.h"

#include <string_view>
#include <utility>

namespace kesto_uplink {

using foundation::Dictionary;
using foundation::Value;

namespace {

constexpr std::string_view applicationKey = "HostApplicationDisplayID";

template <typename Stored> Value valueOf(const std::optional<Stored>& stored)
{
    return stored ? Value(*stored) : Value();
}

Value textOf(const std::string* text)
{
    return text != nullptr ? Value(*text) : Value();
}

bool isTooLong(const Value& value)
{
    return value.kind() == Value::Kind::String && value.stringView().size() > longestText;
}

} // namespace

// A JSON object, written key by key. Keys are plain words.
class Rows::Object {
public:
    Object(std::string_view pseudonym, const std::string& epoch, std::string_view kind)
    {
        add("device", pseudonym);
        add("epoch", epoch);
        add("kind", kind);
    }

    Object& add(std::string_view key, const Value& value)
    {
        text_ += text_.empty() ? "{\"" : ",\"";
        text_ += key;
        text_ += "\":";
        isComplete_ = foundation::appendJson(value, text_) && isComplete_;
        return *this;
    }

    Object& addIfAny(std::string_view key, const std::optional<Value>& value)
    {
        return value && !value->isNull() && !isTooLong(*value) ? add(key, *value) : *this;
    }

    [[nodiscard]] Line line()
    {
        if (!isComplete_)
            return std::unexpected(WhyNot::Unreadable);
        return std::move(text_) + "}\n";
    }

private:
    std::string text_;
    bool isComplete_ = true;
};

Rows::Rows(const UplinkConfiguration& configuration, const Identity& identity)
    : filter_(configuration.allowed, identity.hashKey),
      pseudonym_(identity.pseudonym),
      model_(configuration.model),
      version_(configuration.version)
{
}

Rows::Line Rows::event(const StoredEvent& event, const std::string& epoch, const std::string* application)
{
    if (!filter_.allowsEvent(event.name))
        return std::unexpected(WhyNot::NotAllowed);
    const auto parsed = parseJson(event.payload);
    const auto payload = parsed ? parsed->dictionary() : std::nullopt;
    const auto left = payload ? filter_.event(event.name, *payload) : std::nullopt;
    if (!left || event.name.size() > longestText)
        return std::unexpected(WhyNot::Unreadable);
    const Value* const own = left->find(applicationKey);
    const bool hasOwn = own != nullptr && own->kind() == Value::Kind::String && !isTooLong(*own);
    return Object(pseudonym_, epoch, "event")
        .add("id", event.id)
        .add("time", event.time)
        .add("name", event.name)
        .addIfAny("session", valueOf(event.session))
        .addIfAny("happened", valueOf(event.happened))
        .addIfAny("application", hasOwn ? *own : filter_.ofSession("application", textOf(application)))
        .add("payload", *left)
        .line();
}

Rows::Line Rows::stretch(const StoredStretch& stretch, const std::string& epoch, const std::string* application) const
{
    if (!filter_.allowsStretches())
        return std::unexpected(WhyNot::NotAllowed);
    return Object(pseudonym_, epoch, "stretch")
        .add("id", stretch.id)
        .add("recording", stretch.isRecording)
        .add("began", stretch.began)
        .add("seconds", stretch.seconds)
        .addIfAny("session", valueOf(stretch.session))
        .addIfAny("device_name", filter_.ofStretch("device", valueOf(stretch.device)))
        .addIfAny("format", filter_.ofStretch("format", valueOf(stretch.format)))
        .addIfAny("channels", filter_.ofStretch("channels", valueOf(stretch.channels)))
        .addIfAny("volume", filter_.ofStretch("volume", valueOf(stretch.volume)))
        .addIfAny("application", filter_.ofStretch("application", textOf(application)))
        .add("ending", stretch.ending)
        .line();
}

Rows::Line Rows::session(const StoredSession& session, const std::string& epoch) const
{
    return Object(pseudonym_, epoch, "session")
        .add("id", session.id)
        .addIfAny("reporter", filter_.ofSession("reporter", session.reporter))
        .addIfAny("service", filter_.ofSession("service", valueOf(session.service)))
        .addIfAny("application", filter_.ofSession("application", session.application))
        .addIfAny("process", filter_.ofSession("process", valueOf(session.process)))
        .add("began", session.began)
        .addIfAny("ended", valueOf(session.ended))
        .line();
}

std::string Rows::device(const Cursor& first, const Cursor& last, double sent) const
{
    return Object(pseudonym_, first.epoch, "device")
        .addIfAny("model", model_.empty() ? Value() : Value(model_))
        .addIfAny("version", version_.empty() ? Value() : Value(version_))
        .add("sent", sent)
        .add("first", first.id)
        .add("last", last.id)
        .line()
        .value();
}

} // namespace kesto_uplink
