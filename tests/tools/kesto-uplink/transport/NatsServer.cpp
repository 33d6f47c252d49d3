// SPDX-License-Identifier: Apache-2.0
// The administrator of a server with TLS does not verify: that is what the transport under test is for.
#include "tools/kesto-uplink/transport/NatsServer.h"

#include <chrono>
#include <csignal>
#include <fcntl.h>
#include <fmt/format.h>
#include <stdexcept>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <thread>
#include <unistd.h>

namespace uplink_test {

namespace {

constexpr std::int64_t patience = 30'000; // milliseconds

// The key of `keyed` is made up for this test. `forger` may publish under alpha's subject only.
constexpr const char* accounts = R"(
accounts {
  FLEET {
    jetstream: enabled
    users: [
      { user: admin, password: admin }
      { user: alpha, password: secret, permissions: {
          publish: [ "kesto.events.alpha", "$JS.API.DIRECT.GET.KESTO_STORED.kesto.stored.alpha.>" ]
          subscribe: [ "_INBOX_alpha.>", "kesto.stored.alpha.>" ] } }
      { user: forger, password: secret, permissions: {
          publish: [ "kesto.events.alpha" ], subscribe: [ "_INBOX_forger.>" ] } }
      { nkey: UB43KVROR7TFJ6KAPCYRF2FJROTZAH4FHLTJLPWX4DRZCC5NASLGJBFE, permissions: {
          publish: [ "kesto.events.keyed" ], subscribe: [ "_INBOX_keyed.>" ] } }
    ]
  }
}
)";

void check(natsStatus status, const char* what)
{
    if (status != NATS_OK)
        throw std::runtime_error(fmt::format("nats: {}: {}", what, natsStatus_GetText(status)));
}

} // namespace

NatsServer::NatsServer(const Setup& setup) : hasTLS_(!setup.tls.empty())
{
    const auto path = directory_.path().string();
    support::writeFile(directory_ / "node.conf",
                       fmt::format("server_name: test\nports_file_dir: \"{}\"\nmax_payload: 600KB\n"
                                   "jetstream {{ store_dir: \"{}/streams\", max_mem: 64M, max_file: 256M }}\n{}{}",
                                   path, path, hasTLS_ ? fmt::format("tls {{\n{}\n}}\n", setup.tls) : "", accounts));
    start();
    if (!setup.hasStreams)
        return;
    asAdministrator([](natsConnection*, jsCtx* context) {
        jsStreamConfig events;
        jsStreamConfig_Init(&events);
        const char* subjects[] = {"kesto.events.>"};
        events.Name = "KESTO";
        events.Subjects = subjects;
        events.SubjectsLen = 1;
        events.Discard = js_DiscardNew;
        events.MaxBytes = 8 << 20;
        check(js_AddStream(nullptr, context, &events, nullptr, nullptr), "the stream of events");
        jsStreamConfig confirmations;
        jsStreamConfig_Init(&confirmations);
        const char* stored[] = {"kesto.stored.>"};
        confirmations.Name = "KESTO_STORED";
        confirmations.Subjects = stored;
        confirmations.SubjectsLen = 1;
        confirmations.MaxMsgsPerSubject = 1;
        confirmations.AllowDirect = true;
        check(js_AddStream(nullptr, context, &confirmations, nullptr, nullptr), "the stream of confirmations");
    });
}

NatsServer::~NatsServer()
{
    kill();
}

void NatsServer::start()
{
    const std::string configuration = directory_ / "node.conf";
    const std::string log = directory_ / "log";
    const std::string port = std::to_string(port_.number());
    process_ = ::fork();
    if (process_ == 0) {
        ::prctl(PR_SET_PDEATHSIG, SIGKILL);
        const int output = ::open(log.c_str(), O_WRONLY | O_CREAT | O_APPEND, 0600);
        ::dup2(output, STDOUT_FILENO);
        ::dup2(output, STDERR_FILENO);
        ::execlp("nats-server", "nats-server", "-c", configuration.c_str(), "-a", "127.0.0.1", "-p", port.c_str(),
                 nullptr);
        ::execl("/usr/sbin/nats-server", "nats-server", "-c", configuration.c_str(), "-a", "127.0.0.1", "-p",
                port.c_str(), nullptr);
        ::_exit(127);
    }
    const auto ports = directory_ / fmt::format("nats-server_{}.ports", process_);
    for (int attempt = 0; attempt < 6000; ++attempt) {
        std::this_thread::sleep_for(std::chrono::milliseconds(5));
        if (support::readFile(ports).contains('}'))
            return;
        if (::waitpid(process_, nullptr, WNOHANG) == process_)
            break;
    }
    throw std::runtime_error("nats-server (package nats-server) does not start: " + support::readFile(log));
}

void NatsServer::kill()
{
    if (process_ <= 0)
        return;
    ::kill(process_, SIGKILL);
    ::waitpid(process_, nullptr, 0);
    process_ = 0;
}

void NatsServer::freeze()
{
    ::kill(process_, SIGSTOP);
    ::waitpid(process_, nullptr, WUNTRACED);
}

void NatsServer::goOn()
{
    ::kill(process_, SIGCONT);
}

std::string NatsServer::url(const std::string& scheme, const std::string& host) const
{
    return fmt::format("{}://{}:{}", scheme, host, port());
}

void NatsServer::asAdministrator(const std::function<void(natsConnection*, jsCtx*)>& work)
{
    natsOptions* options = nullptr;
    check(natsOptions_Create(&options), "options");
    natsOptions_SetURL(options, url().c_str());
    natsOptions_SetTimeout(options, patience);
    natsOptions_SetUserInfo(options, "admin", "admin");
    natsOptions_SetSecure(options, hasTLS_);
    natsOptions_SkipServerVerification(options, hasTLS_);
    natsConnection* connection = nullptr;
    const natsStatus connected = natsConnection_Connect(&connection, options);
    natsOptions_Destroy(options);
    check(connected, "the administrator");
    jsCtx* context = nullptr;
    jsOptions contextOptions;
    jsOptions_Init(&contextOptions);
    contextOptions.Wait = patience;
    check(natsConnection_JetStream(&context, connection, &contextOptions), "streams");
    work(connection, context);
    jsCtx_Destroy(context);
    natsConnection_Destroy(connection);
}

void NatsServer::fill()
{
    asAdministrator([](natsConnection*, jsCtx* context) {
        const std::string block(512 << 10, 'x');
        while (js_Publish(nullptr, context, "kesto.events.filler", block.data(), static_cast<int>(block.size()),
                          nullptr, nullptr)
               == NATS_OK) { }
    });
}

void NatsServer::drain()
{
    asAdministrator([](natsConnection*, jsCtx* context) {
        check(js_PurgeStream(context, "KESTO", nullptr, nullptr), "emptying the stream");
    });
}

void NatsServer::publish(const std::string& subject, const std::string& bytes)
{
    asAdministrator([&](natsConnection*, jsCtx* context) {
        check(js_Publish(nullptr, context, subject.c_str(), bytes.data(), static_cast<int>(bytes.size()), nullptr,
                         nullptr),
              "a publish");
    });
}

std::vector<StoredMessage> NatsServer::stored()
{
    std::vector<StoredMessage> messages;
    asAdministrator([&](natsConnection*, jsCtx* context) {
        jsStreamInfo* facts = nullptr;
        check(js_GetStreamInfo(&facts, context, "KESTO", nullptr, nullptr), "the stream");
        const std::uint64_t first = facts->State.FirstSeq;
        const std::uint64_t last = facts->State.LastSeq;
        jsStreamInfo_Destroy(facts);
        for (std::uint64_t number = first; number <= last && last != 0; ++number) {
            natsMsg* message = nullptr;
            if (js_GetMsg(&message, context, "KESTO", number, nullptr, nullptr) != NATS_OK)
                continue; // emptied
            const auto header = [&](const char* name) {
                const char* value = nullptr;
                return natsMsgHeader_Get(message, name, &value) == NATS_OK ? std::string(value) : std::string();
            };
            messages.push_back({natsMsg_GetSubject(message),
                                header("Nats-Msg-Id"),
                                header("Kesto-Edition"),
                                {natsMsg_GetData(message), static_cast<std::size_t>(natsMsg_GetDataLength(message))}});
            natsMsg_Destroy(message);
        }
    });
    return messages;
}

} // namespace uplink_test
