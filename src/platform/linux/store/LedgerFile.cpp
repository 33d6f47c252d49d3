// A file that this version cannot go on with is replaced as a whole, so that a kill leaves the old one or the new one.
#include "platform/linux/store/LedgerFile.h"

#include "platform/linux/files/SystemError.h"

#include <cerrno>
#include <fcntl.h>
#include <sys/file.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <utility>

namespace platform {

using ledger::LedgerImage;

void LedgerFile::Unmap::operator()(LedgerImage* image) const noexcept
{
    ::munmap(image, sizeof *image);
}

LedgerFile::LedgerFile(const std::filesystem::path& directory, const Clock& clock, ProviderLog log)
    : path_(directory / fileName),
      earlier_{.began = clock.secondsSince1970(), .counts = {}, .store = {}, .culprits = {}}
{
    if (auto mapping = open()) {
        mapping_ = *std::move(mapping);
        image_ = mapping_.get();
        return;
    } else {
        log.error("the ledger cannot be kept in {}: {}; what the service counts ends with it: let its user write there",
                  path_.native(), systemErrorText(mapping.error().value()));
    }
    inMemory_ = std::make_unique<LedgerImage>();
    inMemory_->begin(earlier_);
    image_ = inMemory_.get();
}

std::expected<LedgerFile::Mapping, std::error_code> LedgerFile::open()
{
    const int descriptor = ::open(path_.c_str(), O_RDWR | O_CLOEXEC | O_NOFOLLOW);
    if (descriptor < 0 && errno != ENOENT)
        return std::unexpected(systemError());
    if (descriptor < 0)
        return replaceFile(earlier_);
    file_ = FileDescriptor(descriptor);
    if (::flock(file_.get(), LOCK_EX | LOCK_NB) != 0)
        return std::unexpected(systemError());
    struct stat status = {};
    if (::fstat(file_.get(), &status) != 0)
        return std::unexpected(systemError());
    if (std::cmp_not_equal(status.st_size, sizeof(LedgerImage)))
        return replaceFile(earlier_);
    auto mapping = map(file_);
    if (!mapping || (*mapping)->canGoOn())
        return mapping;
    if (const auto account = ledger::accountIn(**mapping))
        earlier_ = *account;
    return replaceFile(earlier_);
}

std::expected<LedgerFile::Mapping, std::error_code> LedgerFile::replaceFile(const ledger::Account& account)
{
    const std::filesystem::path beside = path_.native() + ".new";
    constexpr mode_t othersRead = 0644;
    FileDescriptor file(::open(beside.c_str(), O_RDWR | O_CREAT | O_TRUNC | O_CLOEXEC | O_NOFOLLOW, othersRead));
    if (!file || ::flock(file.get(), LOCK_EX | LOCK_NB) != 0)
        return std::unexpected(systemError());
    if (const int error = ::posix_fallocate(file.get(), 0, sizeof(LedgerImage)); error != 0) {
        ::unlink(beside.c_str());
        return std::unexpected(std::error_code(error, std::generic_category()));
    }
    auto mapping = map(file);
    if (!mapping)
        return mapping;
    (*mapping)->begin(account);
    if (::rename(beside.c_str(), path_.c_str()) != 0)
        return std::unexpected(systemError());
    file_ = std::move(file);
    return mapping;
}

std::expected<LedgerFile::Mapping, std::error_code> LedgerFile::map(const FileDescriptor& file)
{
    void* bytes = ::mmap(nullptr, sizeof(LedgerImage), PROT_READ | PROT_WRITE, MAP_SHARED, file.get(), 0);
    if (bytes == MAP_FAILED)
        return std::unexpected(systemError());
    return Mapping(static_cast<LedgerImage*>(bytes));
}

} // namespace platform
