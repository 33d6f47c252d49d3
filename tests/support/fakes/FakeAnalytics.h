// SPDX-License-Identifier: Apache-2.0
// An analytics service that keeps the sent events. It is as lazy as a service may be: it builds a payload only when the
// test reads it. It drops unwanted events immediately.
#pragma once

#include "foundation/Mutex.h"
#include "ledger/Ledger.h"
#include "platform/Analytics.h"
#include "support/PrintValues.h"

#include <functional>
#include <iosfwd>
#include <optional>
#include <string>
#include <vector>

namespace support {

struct AnalyticsEvent {
    std::string name;
    foundation::Dictionary payload;
    friend bool operator==(const AnalyticsEvent&, const AnalyticsEvent&) = default;
};
void PrintTo(const AnalyticsEvent& event, std::ostream* out);

// Any thread.
class FakeAnalytics final : public platform::Analytics {
public:
    // The ledger counts the events outside turns; the turns count their own.
    explicit FakeAnalytics(ledger::Ledger& ledger) : ledger_(ledger) { }

    // From now on events with a name that matches the glob are wanted; at first none are.
    void use(std::string pattern);

    // The observer gets each name that the service asks about.
    void setObserver(std::function<void(const std::string&)> observer) { observer_ = std::move(observer); }

    // The names that the service asked about, and those of the wanted events that it sent, in order. Builds nothing.
    [[nodiscard]] std::vector<std::string> asked() const;
    [[nodiscard]] std::vector<std::string> sent() const;
    // Their origins.
    [[nodiscard]] std::vector<platform::Origin> origins() const;
    // The sent events, in the second form only those of one name; builds missing payloads. Events with a payload that
    // JSON cannot express are lost.
    [[nodiscard]] std::vector<AnalyticsEvent> events();
    [[nodiscard]] std::vector<foundation::Dictionary> payloads(std::string_view name);
    // The builders of the sent events, in order, for a test that builds the payloads itself; the events are forgotten.
    [[nodiscard]] std::vector<PayloadBuilder> takeBuilders();
    // How many payloads were built.
    [[nodiscard]] int timesBuilt() const;
    // Forgets everything except the wanted names, and releases payloads that are not built.
    void clear();

    [[nodiscard]] bool isEnabled() const override { return true; }
    bool isAnalyticsEventUsed(std::string_view eventName) override;
    void sendAnalyticsEventLazy(platform::Turn& turn, const platform::Origin& origin, std::string_view eventName,
                                PayloadBuilder payloadBuilder) override;
    void sendAnalyticsEventLazy(platform::OutsideTurn, const platform::SourceBegin& source, std::string_view eventName,
                                PayloadBuilder payloadBuilder) override;
    void reportLosses() override { whenReporting_(); }
    // From now on a request to report losses calls this.
    void setReportingObserver(std::function<void()> observer) { whenReporting_ = std::move(observer); }

private:
    struct Sent {
        std::string name;
        platform::Origin origin;
        PayloadBuilder builder;
        std::optional<foundation::Dictionary> payload;
    };
    void send(ledger::Tally& tally, const platform::Origin& origin, std::string name, PayloadBuilder payloadBuilder);
    [[nodiscard]] bool isUsed(const std::string& name) const KESTO_REQUIRES(lock_);

    ledger::Ledger& ledger_;
    std::function<void(const std::string&)> observer_;
    std::function<void()> whenReporting_ = [] { };
    mutable foundation::Mutex lock_;
    std::vector<std::string> used_ KESTO_GUARDED_BY(lock_);
    std::vector<std::string> asked_ KESTO_GUARDED_BY(lock_);
    std::vector<Sent> sent_ KESTO_GUARDED_BY(lock_);
    int timesBuilt_ KESTO_GUARDED_BY(lock_) = 0;
};

} // namespace support
