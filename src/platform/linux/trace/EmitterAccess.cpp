// SPDX-License-Identifier: Apache-2.0
// The page is a sealed memory file: the service maps it for writing first, and the seal then forbids all later writable
// mappings. Answers are given without the lock.
#include "platform/linux/trace/EmitterAccess.h"

#include "platform/linux/files/SystemError.h"
#include "platform/linux/trace/EmittedEvent.h"

#include <atomic>
#include <cassert>
#include <cerrno>
#include <fcntl.h>
#include <sys/mman.h>
#include <utility>

namespace platform {

EmitterAccess::~EmitterAccess()
{
    const foundation::Lock lock(lock_);
    if (mapping_ != nullptr)
        ::munmap(mapping_, TraceSwitchPage::size);
}

void EmitterAccess::ask(const void* asker, Answer answer)
{
    EmitterDescriptors descriptors;
    {
        const foundation::Lock lock(lock_);
        if (!descriptors_) {
            waiting_.insert_or_assign(asker, std::move(answer));
            return;
        }
        descriptors = *descriptors_;
    }
    answer(descriptors);
}

void EmitterAccess::forget(const void* asker)
{
    const foundation::Lock lock(lock_);
    waiting_.erase(asker);
}

// The service makes its own mapping before the seal, which forbids later writable mappings.
std::error_code EmitterAccess::open(int marker)
{
    constexpr int seals = F_SEAL_SHRINK | F_SEAL_GROW | F_SEAL_FUTURE_WRITE | F_SEAL_SEAL;
    const foundation::Lock lock(lock_);
    assert(!descriptors_);
    FileDescriptor page(::memfd_create("kesto-trace", MFD_CLOEXEC | MFD_ALLOW_SEALING));
    if (!page || ::ftruncate(page.get(), TraceSwitchPage::size) != 0)
        return systemError();
    void* const mapping = ::mmap(nullptr, TraceSwitchPage::size, PROT_READ | PROT_WRITE, MAP_SHARED, page.get(), 0);
    if (mapping == MAP_FAILED)
        return systemError();
    mapping_ = mapping;
    if (::fcntl(page.get(), F_ADD_SEALS, seals) != 0)
        return systemError();
    page_ = std::move(page);
    descriptors_ = {.marker = marker, .page = page_.get()};
    return {};
}

void EmitterAccess::answerWaiting()
{
    std::map<const void*, Answer> waiting;
    EmitterDescriptors descriptors;
    {
        const foundation::Lock lock(lock_);
        if (!descriptors_)
            return;
        descriptors = *descriptors_;
        waiting = std::exchange(waiting_, {});
    }
    for (auto& [asker, answer] : waiting)
        answer(descriptors);
}

void EmitterAccess::setTracing(bool isTracing) noexcept
{
    const foundation::Lock lock(lock_);
    if (descriptors_)
        std::atomic_ref(static_cast<TraceSwitchPage*>(mapping_)->isTracing)
            .store(isTracing ? 1 : 0, std::memory_order_release);
}

} // namespace platform
