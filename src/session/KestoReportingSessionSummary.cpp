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

#include <algorithm>
#include <filesystem>
#include <map>

namespace {

using foundation::Dictionary;

constexpr std::string_view summaryKey = "KESTO_Session_Summary_Event";
constexpr std::string_view summaryDirectory = "Audio/Reporting";
constexpr unsigned summaryDirectoryPermissions = 0777;

// The texts of each key's values, joined by commas, in the order in which the keys first came.
//
// Clients choose how many keys there are and how long the texts become, and a text may be many times what its values
// take in the store: what is gathered is paid from the budget while it is.
class ValuesByKey {
public:
    explicit ValuesByKey(std::shared_ptr<KestoReportingStorageBudget> budget) : share_(std::move(budget)) { }

    template <typename Item> void append(std::string_view key, const Item& value)
    {
        if (isOutOfMemory_)
            return;
        const bool isFirst = !moveTo(key);
        foundation::StringBuilder& text = values_[position_].text;
        const std::size_t sizeBefore = text.size();
        if (!isFirst)
            text.append(',');
        if (const auto number = value.number())
            number->appendText(text);
        else if (value.kind() == foundation::Value::Kind::String)
            text.append(value.stringView());
        else
            text.append(value.text());
        pay((isFirst ? bytesOfAKey + key.size() : 0) + text.size() - sizeBefore);
    }

    // Nothing when the budget had too little memory.
    std::optional<Dictionary> finish() &&
    {
        if (isOutOfMemory_)
            return std::nullopt;
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
    static constexpr std::size_t bytesOfAKey = 256; // in all that knows it, here and in the dictionary
    static constexpr std::size_t paidAtOnce = 4096;

    // False when the key is new. Keys come in the same order in nearly every message: the next one is tried first.
    // A sorted index otherwise: no choice of keys makes it slow.
    bool moveTo(std::string_view key)
    {
        ++position_;
        if (position_ < values_.size() && values_[position_].key == key)
            return true;
        const auto found = positions_.find(key);
        position_ = found == positions_.end() ? values_.size() : found->second;
        if (found != positions_.end())
            return true;
        values_.push_back({key, {}});
        positions_.emplace(values_.back().key, position_);
        return false;
    }

    void pay(std::size_t bytes)
    {
        used_ += bytes;
        if (used_ > share_.bytes())
            isOutOfMemory_ = !share_.grow(std::max(used_ - share_.bytes(), paidAtOnce));
    }

    std::vector<Values> values_;
    std::map<std::string_view, std::size_t>
        positions_; // the keys are those of `values_`, whose characters stay in place
    std::size_t position_ = 0;
    KestoReportingStorageShare share_;
    std::size_t used_ = 0;
    bool isOutOfMemory_ = false;
};

// What a client chose, made fit to be part of a file name: it cannot leave the directory, and whole characters of it
// take no more bytes than there is room for.
std::string fileNamePart(std::string_view text, std::size_t room)
{
    std::string part(foundation::cutBetweenCharacters(text, room));
    for (char& character : part)
        if (character == '/' || character == '\0')
            character = '_';
    return part;
}

// Whether it has the shape of the names that `summaryFileName` makes.
bool isSummaryFileName(std::string_view name)
{
    constexpr std::string_view shape = "dddddddd-dddddd+dddd-kesto-";
    const auto fits = [](char character, char expected) {
        switch (expected) {
        case 'd': return character >= '0' && character <= '9';
        case '+': return character == '+' || character == '-';
        default: return character == expected;
        }
    };
    return name.size() > shape.size() && std::ranges::equal(name.substr(0, shape.size()), shape, fits)
        && name.ends_with(".json");
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
    ValuesByKey values(budget_);
    values.append(summaryKey, foundation::Value(serviceType_.load()));
    nestedAggregatedPayloadData_->forEach([&](const KestoReportingMessageStore::Message& message) {
        message.payload.forEach([&](std::string_view key, const auto& value) { values.append(key, value); });
    });
    auto summary = std::move(values).finish();
    if (!summary) {
        ++messagesLost_;
        KESTO_LOG(KestoReportingSessionCategory(), Error, "no memory left for the summary of session {}; it is lost",
                  reporterID_);
    }
    return summary;
}

void KestoReportingSession::writeSummaryJson() const
{
    const auto store = this->store();
    if (!KestoReportingUtilityIsInternalBuild() || !store || store->empty())
        return;
    platform::FileSystem& files = platform::current().fileSystem;
    const std::filesystem::path directory = files.diagnosticLogRoot() / summaryDirectory;
    const auto directoryMade = files.createDirectories(directory, summaryDirectoryPermissions);
    const std::filesystem::path path = directory / summaryFileName();
    const auto file = files.createAtomically(path);

    std::uint64_t bytes = 0;
    const bool isSerialised = writeJson(*store, [&](std::string_view text) {
        bytes += text.size();
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
    if (written)
        files.keepWithin(directory, {mostSummaryFiles, mostSummaryBytes, isSummaryFileName}, bytes);
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
