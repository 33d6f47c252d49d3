// SPDX-License-Identifier: Apache-2.0
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
      besidePath_(path_.native() + ".new"),
      clock_(clock),
      log_(log),
      earlier_{.began = clock.secondsSince1970(), .counts = {}, .store = {}, .culprits = {}},
      lookAgainAt_(clock.systemUptime() + secondsBetweenLooks)
{
    if (auto mapping = open()) {
        mapping_ = *std::move(mapping);
    } else {
        log.error("the ledger cannot be kept in {}: {}; what the service counts ends with it: let its user write there",
                  path_.native(), systemErrorText(mapping.error().value()));
        mapping_ = countInMemory();
    }
}

// --- At the start

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
    auto file = makeFile();
    if (!file)
        return std::unexpected(file.error());
    auto mapping = map(*file);
    if (!mapping)
        return mapping;
    (*mapping)->begin(account);
    if (::rename(besidePath_.c_str(), path_.c_str()) != 0)
        return std::unexpected(systemError());
    file_ = *std::move(file);
    return mapping;
}

// A file of that size, not in its place yet.
std::expected<FileDescriptor, std::error_code> LedgerFile::makeFile() const
{
    constexpr mode_t othersRead = 0644;
    FileDescriptor file(::open(besidePath_.c_str(), O_RDWR | O_CREAT | O_TRUNC | O_CLOEXEC | O_NOFOLLOW, othersRead));
    if (!file || ::flock(file.get(), LOCK_EX | LOCK_NB) != 0)
        return std::unexpected(systemError());
    if (const int error = ::posix_fallocate(file.get(), 0, sizeof(LedgerImage)); error != 0) {
        ::unlink(besidePath_.c_str());
        return std::unexpected(std::error_code(error, std::generic_category()));
    }
    return file;
}

std::expected<LedgerFile::Mapping, std::error_code> LedgerFile::map(const FileDescriptor& file)
{
    void* bytes = ::mmap(nullptr, sizeof(LedgerImage), PROT_READ | PROT_WRITE, MAP_SHARED, file.get(), 0);
    if (bytes == MAP_FAILED)
        return std::unexpected(systemError());
    return Mapping(static_cast<LedgerImage*>(bytes));
}

// A file without a name.
LedgerFile::Mapping LedgerFile::countInMemory()
{
    isInMemory_ = true;
    file_ = FileDescriptor(::memfd_create(fileName.data(), MFD_CLOEXEC));
    if (!file_ || ::ftruncate(file_.get(), sizeof(LedgerImage)) != 0)
        throw std::system_error(systemError(), "memory for the ledger");
    auto mapping = map(file_);
    if (!mapping)
        throw std::system_error(mapping.error(), "memory for the ledger");
    (*mapping)->begin(earlier_);
    return *std::move(mapping);
}

// --- Later

void LedgerFile::keepInPlace(ledger::Ledger& ledger)
{
    const double now = clock_.systemUptime();
    if (now < lookAgainAt_.load(std::memory_order_relaxed))
        return;
    lookAgainAt_ = now + secondsBetweenLooks;
    ledger.withoutPosts([this] {
        if (!mustBeMade())
            return;
        const auto done = makeAnew();
        if (done)
            log_.error("{} was not in its place; it is made anew with all that was counted", path_.native());
        else if (!hasFailed_)
            log_.error("{} is not in its place and cannot be made anew: {}; what the service counts ends with it",
                       path_.native(), systemErrorText(done.error().value()));
        hasFailed_ = !done;
    });
}

// A file that was there at the start and could not be used is another service's, or it may have counts that are not in
// memory. One in which another service counts is left alone.
bool LedgerFile::mustBeMade() const
{
    struct stat there = {};
    if (::stat(path_.c_str(), &there) != 0)
        return errno == ENOENT;
    struct stat own = {};
    if (isInMemory_ || ::fstat(file_.get(), &own) != 0 || (there.st_dev == own.st_dev && there.st_ino == own.st_ino))
        return false;
    const FileDescriptor other(::open(path_.c_str(), O_RDONLY | O_CLOEXEC | O_NOFOLLOW));
    return !other || ::flock(other.get(), LOCK_EX | LOCK_NB) == 0;
}

// The new file comes to the image's address at once. A count that another thread makes meanwhile goes into the old file
// or into the new one; those that went into the old one after it was copied are added.
std::expected<void, std::error_code> LedgerFile::makeAnew()
{
    auto file = makeFile();
    if (!file)
        return std::unexpected(file.error());
    const auto old = map(file_);
    const auto fresh = map(*file);
    if (!old || !fresh)
        return std::unexpected(old ? fresh.error() : old.error());
    (*fresh)->copyFrom(**old);
    const LedgerImage::Words copied = (*fresh)->live;
    if (::rename(besidePath_.c_str(), path_.c_str()) != 0)
        return std::unexpected(systemError());
    if (::mmap(mapping_.get(), sizeof(LedgerImage), PROT_READ | PROT_WRITE, MAP_SHARED | MAP_FIXED, file->get(), 0)
        == MAP_FAILED)
        return std::unexpected(systemError());
    mapping_->addCountedSince(copied, **old);
    file_ = *std::move(file);
    isInMemory_ = false;
    return {};
}

} // namespace platform
