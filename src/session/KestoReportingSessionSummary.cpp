// The session's summary: every value that each key took, in one event, and on internal builds the whole message
// store as a file that diagnostic tools read.
#define KESTO_LOG_FILE "KestoReportingSession"
#include "foundation/Format.h"
#include "foundation/LocalTime.h"
#include "foundation/PrettyJsonWriter.h"
#include "foundation/StringBuilder.h"
#include "platform/Platform.h"
#include "session/KestoReportingSession.h"
#include "utility/KestoReportingUtility.h"

#include <filesystem>
#include <unordered_map>

namespace {

using foundation::Dictionary;

constexpr std::string_view summaryKey = "KESTO_Session_Summary_Event";
constexpr std::string_view summaryDirectory = "Audio/Reporting";
constexpr unsigned summaryDirectoryPermissions = 0777;

// The texts of each key's values, joined by commas, in the order in which the keys first came.
class ValuesByKey {
public:
    template <typename Item> void append(std::string_view key, const Item& value)
    {
        const bool isFirst = !moveTo(key);
        foundation::StringBuilder& text = values_[position_].text;
        if (!isFirst)
            text.append(',');
        if (const auto number = value.number())
            number->appendText(text);
        else if (value.kind() == foundation::Value::Kind::String)
            text.append(value.stringView());
        else
            text.append(value.text());
    }

    Dictionary finish() &&
    {
        Dictionary::Entries entries;
        for (auto& [key, text] : values_)
            entries.push_back({key, std::move(text).finish()});
        return entries;
    }

private:
    struct Values {
        foundation::String key;
        foundation::StringBuilder text;
    };

    // False when the key is new. Keys come in the same order in nearly every message: the next one is tried first.
    bool moveTo(std::string_view key)
    {
        ++position_;
        if (position_ < values_.size() && values_[position_].key == key)
            return true;
        const auto [found, isNew] = positions_.try_emplace(std::string(key), values_.size());
        if (isNew)
            values_.push_back({key, {}});
        position_ = found->second;
        return !isNew;
    }

    std::vector<Values> values_;
    std::unordered_map<std::string, std::size_t> positions_;
    std::size_t position_ = 0;
};

// What a client chose, made fit to be part of a file name: it cannot leave the directory, and whole characters of it
// take no more bytes than there is room for.
std::string fileNamePart(std::string_view text, std::size_t room)
{
    const auto isInsideCharacter = [text](std::size_t at) {
        return (static_cast<unsigned char>(text[at]) & 0xC0) == 0x80;
    };
    if (room < text.size()) {
        while (room > 0 && isInsideCharacter(room))
            --room;
        text = text.substr(0, room);
    }
    std::string part(text);
    for (char& character : part)
        if (character == '/' || character == '\0')
            character = '_';
    return part;
}

// An array of one-entry objects, identifier to payload. False when the store holds what JSON cannot say.
bool writeJson(const KestoReportingMessageStore& store, foundation::PrettyJsonWriter::Sink sink)
{
    foundation::PrettyJsonWriter writer(std::move(sink));
    writer.beginArray();
    store.forEach([&](const KestoReportingMessageStore::Message& message) {
        writer.beginObject();
        writer.key(store.identifier(message));
        writer.beginObject();
        message.payload.forEach([&](std::string_view key, const auto& value) {
            writer.key(key);
            writer.write(value);
        });
        writer.endObject();
        writer.endObject();
    });
    writer.endArray();
    return writer.isWhole();
}

} // namespace

std::optional<Dictionary> KestoReportingSession::createSummaryEventForSession() const
{
    const foundation::Lock lock(nestedAggregatedPayloadDataLock_);
    if (!nestedAggregatedPayloadData_ || nestedAggregatedPayloadData_->empty())
        return std::nullopt;
    ValuesByKey values;
    values.append(summaryKey, foundation::Value(serviceType_.load()));
    nestedAggregatedPayloadData_->forEach([&](const KestoReportingMessageStore::Message& message) {
        message.payload.forEach([&](std::string_view key, const auto& value) { values.append(key, value); });
    });
    return std::move(values).finish();
}

void KestoReportingSession::writeSummaryJson() const
{
    const foundation::Lock lock(nestedAggregatedPayloadDataLock_);
    if (!KestoReportingUtilityIsInternalBuild() || !nestedAggregatedPayloadData_
        || nestedAggregatedPayloadData_->empty())
        return;
    platform::FileSystem& files = platform::current().fileSystem;
    const std::filesystem::path directory = files.diagnosticLogRoot() / summaryDirectory;
    const auto directoryMade = files.createDirectories(directory, summaryDirectoryPermissions);
    const std::filesystem::path path = directory / summaryFileName();
    const auto file = files.createAtomically(path);

    const bool isSerialised = writeJson(*nestedAggregatedPayloadData_, [&](std::string_view text) {
        if (file)
            (*file)->write(text);
    });
    if (!isSerialised) {
        KESTO_LOG(KestoReportingSessionCategory(), Error, "dataWithJSONObject: a number is not finite");
        if (file)
            (*file)->clear();
    }
    if (!directoryMade)
        KESTO_LOG(KestoReportingSessionCategory(), Error, "can't create logging directory at {}: {}",
                  directory.string(), directoryMade.error().message());

    auto written = file ? (*file)->commit() : std::unexpected(file.error());
    if (written && !directoryMade)
        written = std::unexpected(directoryMade.error());
    if (written)
        KESTO_LOG(KestoReportingSessionCategory(), Info, "jsonOutput writeToURL: {}", path.string());
    else
        KESTO_LOG(KestoReportingSessionCategory(), Error, "jsonOutput writeToURL: {}", written.error().message());
}

std::string KestoReportingSession::summaryFileName() const
{
    constexpr std::size_t longestName = 255; // of any file system
    const std::string time =
        foundation::localTimeText(platform::current().clock.secondsSince1970(), "{:%Y%m%d-%H%M%S%z}");
    const std::string beginning = foundation::format("{}-kesto-", time);
    const std::string end =
        foundation::format("-{}.json", KestoReportingUtilityGenerateServiceNameFromServiceType(serviceType_));
    const std::string application = KestoReportingUtilityRetrieveAppName(configuration()).text();
    return beginning + fileNamePart(application, longestName - beginning.size() - end.size()) + end;
}
