// What a client's threads emit trace events through while the client's own thread connects, loses its connection and
// connects again.
//
// They take no lock, so what they use must never go from under them: the page that they look at stays at its address,
// and the descriptor that they write to keeps its number, for as long as the tracer lives. What changes is what is
// behind them: an empty page of the library's own or the service's, nothing that can be written to or the service's
// marker. The system exchanges either in one step.
#pragma once

#include "kesto/trace.h"
#include "platform/linux/files/FileDescriptor.h"

#include <array>
#include <memory>

namespace libkesto {

// What the service hands over: the marker and the page.
using TraceDescriptors = std::array<platform::FileDescriptor, 2>;

class Tracer final : public kesto_tracer {
public:
    // Null, with `errno`, when the system has no descriptor or no page. May throw std::bad_alloc.
    [[nodiscard]] static std::unique_ptr<Tracer> create();
    ~Tracer();
    Tracer(const Tracer&) = delete;
    Tracer& operator=(const Tracer&) = delete;

    // Any thread.
    void emit(std::uint32_t code, const std::array<std::uint64_t, 4>& arguments) const noexcept;

    // From now on events go to the service. False when what it handed over is not what it should be. The client's
    // thread.
    [[nodiscard]] bool attach(TraceDescriptors descriptors) noexcept;
    // From now on they go nowhere. The client's thread.
    void detach() noexcept;

private:
    Tracer() noexcept : kesto_tracer{} { }
    [[nodiscard]] bool mapEmptyPage(int flags) noexcept;

    void* page_ = nullptr;
    platform::FileDescriptor nowhere_; // open, but nothing can be written to it
    platform::FileDescriptor marker_; // its number stays
};

} // namespace libkesto
