// The session's summary: every value that each key took, in one event, and on internal builds the whole message
// store as a file that diagnostic tools read.
#define KESTO_LOG_FILE "KestoReportingSession"
#include "foundation/Format.h"
#include "foundation/LocalTime.h"
#include "foundation/PrettyJsonWriter.h"
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
        std::string& text = values_[position_].text;
        if (!isFirst)
            text += ',';
        value.appendText(text);
    }

    Dictionary finish() &&
    {
        Dictionary::Entries entries;
        for (auto& [key, text] : values_) {
            entries.push_back({key, std::string_view(text)});
            text = std::string(); // a long session's texts are not in memory twice
        }
        return entries;
    }

private:
    struct Values {
        foundation::String key;
        std::string text;
    };

    // False when the key is new. Keys come in the same order in nearly every message: the next one is tried first.
    bool moveTo(std::string_view key)
    {
        if (++position_ < values_.size() && values_[position_].key == key)
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

// What a client chose, made fit to be part of a file name: it can neither leave the directory nor be too long for
// the file system, which takes 255 bytes a name.
std::string fileNamePart(std::string_view text)
{
    constexpr std::size_t longestPart = 160;
    std::string part(text.substr(0, longestPart));
    while (!part.empty() && !foundation::isValidUtf8(part)) // cut inside a character
        part.pop_back();
    for (char& character : part)
        if (character == '/' || character == '\0')
            character = '_';
    return part;
}

// An array of one-entry objects, identifier to payload. False when the store holds what JSON cannot say.
bool writeJson(const KestoReportingMessageStore& store, foundation::PrettyJsonWriter::Sink sink)
{
    foundation::PrettyJsonWriter writer(std::move(sink));
    bool isComplete = true;
    writer.beginArray();
    store.forEach([&](const KestoReportingMessageStore::Message& message) {
        writer.beginObject();
        writer.key(store.identifier(message));
        writer.beginObject();
        message.payload.forEach([&](std::string_view key, const auto& value) {
            writer.key(key);
            isComplete &= writer.write(value);
        });
        writer.endObject();
        writer.endObject();
    });
    writer.endArray();
    return isComplete;
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
    const std::string time =
        foundation::localTimeText(platform::current().clock.secondsSince1970(), "{:%Y%m%d-%H%M%S%z}");
    const std::string application = KestoReportingUtilityRetrieveAppName(configuration()).text();
    return foundation::format("{}-kesto-{}-{}.json", time, fileNamePart(application),
                              KestoReportingUtilityGenerateServiceNameFromServiceType(serviceType_));
}
