// SPDX-License-Identifier: Apache-2.0
// The writer collects records in memory and writes them in large pieces.
#include "platform/linux/trace/LinuxPerformanceWriter.h"

#include "foundation/text/Format.h"
#include "foundation/values/Json.h"

#include <cmath>

namespace platform {
namespace {

std::string jsonText(std::string_view text)
{
    std::string json;
    (void)foundation::appendJson(foundation::Value(text), json); // text always has a JSON form
    return json;
}

std::string_view nameOf(PerformanceUnit unit)
{
    switch (unit) {
    case PerformanceUnit::Nanoseconds: return "ns";
    }
    return {};
}

class LinuxPerformanceFile final : public PerformanceFile {
public:
    LinuxPerformanceFile(std::unique_ptr<AtomicFile> file, std::filesystem::path path, std::string_view project,
                         std::uint32_t version, ProviderLog log, std::size_t largest)
        : file_(std::move(file)),
          path_(std::move(path)),
          log_(log),
          room_(largest),
          text_(foundation::format(R"({{"project":{},"version":{},"records":[)", jsonText(project), version))
    {
    }
    ~LinuxPerformanceFile() override
    {
        remark("lostValues", lost_);
        file_->write(text_ + "\n]" + remarks_ + "}\n");
        if (lost_ != 0)
            log_.error("{} has become too large; {} records are lost", path_.native(), lost_);
        if (const auto written = file_->commit(); !written)
            log_.error("{} cannot be written ({}); its results are lost", path_.native(), written.error().message());
    }
    LinuxPerformanceFile(const LinuxPerformanceFile&) = delete;
    LinuxPerformanceFile& operator=(const LinuxPerformanceFile&) = delete;

    void write(std::string_view name, double value, PerformanceUnit unit) override
    {
        constexpr std::size_t large = std::size_t{64} << 10;
        if (!hasRoomFor(name)) {
            ++lost_;
            return;
        }
        const std::size_t before = text_.size();
        text_ += isFirst_ ? "\n" : ",\n";
        isFirst_ = false;
        text_.append(R"({"name":)").append(nameText_).append(R"(,"value":)");
        if (std::isfinite(value))
            foundation::Number(value).appendText(text_);
        else
            text_ += "null"; // JSON cannot express it
        text_.append(R"(,"unit":")").append(nameOf(unit)).append("\"}");
        room_ -= text_.size() - before;
        if (text_.size() >= large) {
            file_->write(text_);
            text_.clear();
        }
    }

    void remark(std::string_view key, const foundation::Value& value) override
    {
        remarks_.append(",").append(jsonText(key)).append(":");
        if (!foundation::appendJson(value, remarks_))
            remarks_ += "null"; // JSON cannot express it
    }

private:
    // The length alone rejects nearly all names that do not fit: reading a long name again for each lost value would
    // take minutes. As JSON text a name is even longer, so a name that did not fit leaves room only for shorter ones.
    bool hasRoomFor(std::string_view name)
    {
        if (room_ < name.size() + mostBesideName)
            return false;
        rememberName(name);
        if (room_ >= nameText_.size() + mostBesideName)
            return true;
        room_ = name.size() + mostBesideName - 1;
        return false;
    }

    // Values of one name come in a row.
    void rememberName(std::string_view name)
    {
        if (name == name_ && !nameText_.empty())
            return;
        name_ = name;
        nameText_ = jsonText(name);
    }

    static constexpr std::size_t mostBesideName = 64; // bytes of a record besides its name

    const std::unique_ptr<AtomicFile> file_;
    const std::filesystem::path path_;
    const ProviderLog log_;
    std::size_t room_; // bytes that records may still take
    std::uint64_t lost_ = 0;
    std::string text_; // records that are not written yet
    std::string remarks_;
    std::string name_;
    std::string nameText_; // as it stands in the file
    bool isFirst_ = true;
};

} // namespace

std::unique_ptr<PerformanceFile> LinuxPerformanceWriter::open(const std::filesystem::path& path,
                                                              std::string_view project, std::uint32_t version)
{
    std::error_code ignored;
    if (std::filesystem::is_directory(std::filesystem::symlink_status(path, ignored))) {
        log_.error("{} is a directory: remove it", path.native()); // a file cannot replace it
        return nullptr;
    }
    auto file = files_.createAtomically(path);
    if (!file) {
        log_.error("{} cannot be opened ({}): let the user of the service write there", path.native(),
                   file.error().message());
        return nullptr;
    }
    return std::make_unique<LinuxPerformanceFile>(*std::move(file), path, project, version, log_, largest_);
}

} // namespace platform
