// SPDX-License-Identifier: Apache-2.0
// The file in which the ledger outlives the process: `analytics.ledger` in the state directory, beside the store.
//
// The service counts in the mapped file itself. So the kernel has every count as soon as it is made, also when the
// service is killed or when the disk has no room for the store; the file has all its room from the start.
//
// A file that is removed or replaced under the service would take all counts along at its end, so it is made anew.
#pragma once

#include "ledger/Ledger.h"
#include "ledger/LedgerImage.h"
#include "platform/Clock.h"
#include "platform/linux/files/FileDescriptor.h"
#include "platform/linux/log/ProviderLog.h"

#include <atomic>
#include <expected>
#include <filesystem>
#include <memory>
#include <string_view>
#include <system_error>

namespace platform {

// Any thread; the ledger uses the image.
class LedgerFile {
public:
    static constexpr std::string_view fileName = "analytics.ledger";

    static constexpr double secondsBetweenLooks = 1;

    // Opens the file or makes it. If that fails, it logs this, and the counts of this run end with the process, unless
    // the file can be made later.
    LedgerFile(const std::filesystem::path& directory, const Clock& clock, ProviderLog log);

    [[nodiscard]] ledger::LedgerImage& image() noexcept { return *mapping_; }

    // Looks once a second whether the file is in its place. If it was removed or replaced, it is made anew with all
    // that is counted in the image, and a log line says so. The ledger is the one that counts in the image. Costs some
    // nanoseconds otherwise.
    void keepInPlace(ledger::Ledger& ledger);

private:
    struct Unmap {
        void operator()(ledger::LedgerImage* image) const noexcept;
    };
    using Mapping = std::unique_ptr<ledger::LedgerImage, Unmap>;

    [[nodiscard]] std::expected<Mapping, std::error_code> open();
    [[nodiscard]] std::expected<Mapping, std::error_code> replaceFile(const ledger::Account& account);
    [[nodiscard]] std::expected<FileDescriptor, std::error_code> makeFile() const;
    [[nodiscard]] static std::expected<Mapping, std::error_code> map(const FileDescriptor& file);
    [[nodiscard]] Mapping countInMemory();
    [[nodiscard]] bool mustBeMade() const;
    [[nodiscard]] std::expected<void, std::error_code> makeAnew();

    const std::filesystem::path path_;
    const std::filesystem::path besidePath_; // where it is made
    const Clock& clock_;
    const ProviderLog log_;
    FileDescriptor file_; // locked, so that no second service counts in it; without a place for it, in memory
    bool isInMemory_ = false;
    ledger::Account earlier_; // what stood in a file of another version
    Mapping mapping_;
    std::atomic<double> lookAgainAt_; // uptime, in seconds
    bool hasFailed_ = false; // to make it anew
};

} // namespace platform
