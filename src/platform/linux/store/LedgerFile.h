// The file in which the ledger outlives the process: `analytics.ledger` in the state directory, beside the store.
//
// The service counts in the mapped file itself. So the kernel has every count as soon as it is made, also when the
// service is killed or when the disk has no room for the store; the file has all its room from the start.
#pragma once

#include "ledger/LedgerImage.h"
#include "platform/Clock.h"
#include "platform/linux/files/FileDescriptor.h"
#include "platform/linux/log/ProviderLog.h"

#include <expected>
#include <filesystem>
#include <memory>
#include <string_view>
#include <system_error>

namespace platform {

// Any thread makes and destroys it; the ledger uses the image.
class LedgerFile {
public:
    static constexpr std::string_view fileName = "analytics.ledger";

    // Opens the file or makes it. If that fails, it logs this, and the counts of this run end with the process.
    LedgerFile(const std::filesystem::path& directory, const Clock& clock, ProviderLog log);

    [[nodiscard]] ledger::LedgerImage& image() noexcept { return *image_; }

private:
    struct Unmap {
        void operator()(ledger::LedgerImage* image) const noexcept;
    };
    using Mapping = std::unique_ptr<ledger::LedgerImage, Unmap>;

    [[nodiscard]] std::expected<Mapping, std::error_code> open();
    [[nodiscard]] std::expected<Mapping, std::error_code> replaceFile(const ledger::Account& account);
    [[nodiscard]] static std::expected<Mapping, std::error_code> map(const FileDescriptor& file);

    const std::filesystem::path path_;
    FileDescriptor file_; // locked, so that no second service counts in it
    ledger::Account earlier_; // what stood in a file of another version
    Mapping mapping_;
    std::unique_ptr<ledger::LedgerImage> inMemory_; // without a file
    ledger::LedgerImage* image_;
};

} // namespace platform
