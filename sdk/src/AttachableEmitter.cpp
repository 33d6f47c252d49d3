// SPDX-License-Identifier: Apache-2.0
// All steps that can fail come before the exchange, which is one system call.
#include "AttachableEmitter.h"

#include "platform/linux/trace/EmittedEvent.h"

#include <cerrno>
#include <fcntl.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <unistd.h>

// The thread sanitizer takes mapping for writing. A page that is put over another one is not written: a thread that
// reads meanwhile sees the one or the other.
#if defined(__has_feature)
#if __has_feature(thread_sanitizer)
#define KESTO_THREADS_ARE_WATCHED
#endif
#elif defined(__SANITIZE_THREAD__)
#define KESTO_THREADS_ARE_WATCHED
#endif
#ifdef KESTO_THREADS_ARE_WATCHED
extern "C" void AnnotateIgnoreWritesBegin(const char* file, int line);
extern "C" void AnnotateIgnoreWritesEnd(const char* file, int line);
#else
static void AnnotateIgnoreWritesBegin(const char*, int) { }
static void AnnotateIgnoreWritesEnd(const char*, int) { }
#endif

namespace libkesto {
namespace {

using platform::EmittedEvent;
using platform::FileDescriptor;
using platform::TraceSwitchPage;

// Whether the file has the right size and is sealed against shrinking: reading a page beyond a file's end kills the
// program.
bool isPage(const FileDescriptor& file) noexcept
{
    struct stat status = {};
    const int seals = ::fcntl(file.get(), F_GET_SEALS);
    return ::fstat(file.get(), &status) == 0 && status.st_size >= static_cast<off_t>(TraceSwitchPage::size)
        && seals >= 0 && (seals & F_SEAL_SHRINK) != 0;
}

constexpr int emptyPage = MAP_PRIVATE | MAP_ANONYMOUS;

// Maps a page for reading; with MAP_FIXED it replaces the page at that address.
void* mapPage(void* place, int flags, int file) noexcept
{
    AnnotateIgnoreWritesBegin(__FILE__, __LINE__);
    void* const page = ::mmap(place, TraceSwitchPage::size, PROT_READ, flags, file, 0);
    AnnotateIgnoreWritesEnd(__FILE__, __LINE__);
    return page;
}

} // namespace

std::unique_ptr<AttachableEmitter> AttachableEmitter::create()
{
    std::unique_ptr<AttachableEmitter> emitter(new AttachableEmitter);
    emitter->nowhere_ = FileDescriptor(::open("/", O_PATH | O_CLOEXEC));
    void* const page = mapPage(nullptr, emptyPage, -1);
    if (page == MAP_FAILED)
        return nullptr;
    emitter->page_ = page;
    emitter->is_tracing = &static_cast<const TraceSwitchPage*>(page)->isTracing;
    if (emitter->nowhere_)
        emitter->marker_ = FileDescriptor(::fcntl(emitter->nowhere_.get(), F_DUPFD_CLOEXEC, 0));
    return emitter->marker_ ? std::move(emitter) : nullptr;
}

AttachableEmitter::~AttachableEmitter()
{
    if (page_ != nullptr)
        ::munmap(page_, TraceSwitchPage::size);
}

void AttachableEmitter::emit(std::uint32_t code, const std::array<std::uint64_t, 4>& arguments) const noexcept
{
    const int before = errno;
    const EmittedEvent record{.code = code, .arguments = arguments};
    [[maybe_unused]] const ssize_t written = ::write(marker_.get(), &record, sizeof record);
    errno = before;
}

// Exchanges the marker first: callers emit only after the page shows a trace.
bool AttachableEmitter::attach(ReceivedDescriptors descriptors) noexcept
{
    const auto& [marker, page] = descriptors;
    return marker && isPage(page) && ::dup3(marker.get(), marker_.get(), O_CLOEXEC) >= 0
        && mapPage(page_, MAP_SHARED | MAP_FIXED, page.get()) != MAP_FAILED;
}

// Exchanges the marker first, too, so that late events are discarded. Neither exchange can fail, because it needs
// neither a new descriptor nor a new range of addresses.
void AttachableEmitter::detach() noexcept
{
    static_cast<void>(::dup3(nowhere_.get(), marker_.get(), O_CLOEXEC));
    static_cast<void>(mapPage(page_, emptyPage | MAP_FIXED, -1));
}

} // namespace libkesto
