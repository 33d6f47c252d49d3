// SPDX-License-Identifier: Apache-2.0
// libcurl asks, and keeps the connection to each server.
#include "fleet-database/ClickHouseServers.h"

#include <curl/curl.h>
#include <fmt/format.h>

#include <algorithm>
#include <array>
#include <charconv>
#include <stdexcept>
#include <system_error>
#include <utility>

namespace fleet_database {

namespace {

constexpr long longestConnecting = 5; // seconds

std::string firstLine(std::string_view text)
{
    constexpr std::size_t longest = 500;
    return std::string(text.substr(0, std::min(text.find('\n'), longest)));
}

// What libcurl reads, up to a length.
struct Kept {
    Answer* answer;
    std::size_t longest;
};

std::size_t keep(char* bytes, std::size_t, std::size_t count, void* kept) noexcept
{
    const auto& [answer, longest] = *static_cast<Kept*>(kept);
    const std::size_t left = longest - std::min(longest, answer->text.size());
    answer->isCut |= count > left;
    answer->text.append(bytes, std::min(count, left));
    return count;
}

} // namespace

struct ClickHouseServers::Connection {
    Connection() : handle(curl_easy_init())
    {
        if (handle == nullptr)
            throw std::runtime_error("libcurl cannot be used");
        headers = curl_slist_append(headers, "Expect:"); // no wait for "100 Continue"
        headers = curl_slist_append(headers, "Content-Type: application/x-ndjson");
    }
    ~Connection()
    {
        curl_slist_free_all(headers);
        curl_easy_cleanup(handle);
    }
    Connection(const Connection&) = delete;
    Connection& operator=(const Connection&) = delete;

    [[nodiscard]] std::string escaped(const std::string& text) const
    {
        char* const escapedText = curl_easy_escape(handle, text.data(), static_cast<int>(text.size()));
        std::string result = escapedText == nullptr ? "" : escapedText;
        curl_free(escapedText);
        return result;
    }

    CURL* handle;
    curl_slist* headers = nullptr;
};

ClickHouseServers::ClickHouseServers(ClickHouseConfiguration configuration, std::size_t longestAnswer)
    : configuration_(std::move(configuration)),
      longestAnswer_(longestAnswer),
      connection_(std::make_unique<Connection>())
{
}

ClickHouseServers::~ClickHouseServers() = default;

Answer ClickHouseServers::askServer(const std::string& server, const std::string& query, std::string_view body)
{
    std::string address = fmt::format("{}/?database={}&query={}", server, connection_->escaped(configuration_.database),
                                      connection_->escaped(query));
    for (const auto& [name, value] : configuration_.settings)
        address += fmt::format("&{}={}", connection_->escaped(name), connection_->escaped(value));
    Answer answer;
    Kept kept{&answer, longestAnswer_};
    std::array<char, CURL_ERROR_SIZE> error{};
    CURL* const handle = connection_->handle;
    curl_easy_reset(handle); // keeps the connections
    const auto set = [handle](CURLoption option, auto value) { curl_easy_setopt(handle, option, value); };
    set(CURLOPT_URL, address.c_str());
    set(CURLOPT_PROTOCOLS_STR, "http,https");
    set(CURLOPT_NOSIGNAL, 1L);
    set(CURLOPT_NOPROXY, "*");
    set(CURLOPT_POST, 1L);
    set(CURLOPT_POSTFIELDS, body.data());
    set(CURLOPT_POSTFIELDSIZE_LARGE, static_cast<curl_off_t>(body.size()));
    set(CURLOPT_HTTPHEADER, connection_->headers);
    set(CURLOPT_CONNECTTIMEOUT, longestConnecting);
    set(CURLOPT_TIMEOUT, static_cast<long>(configuration_.timeLimit.count()));
    set(CURLOPT_WRITEFUNCTION, keep);
    set(CURLOPT_WRITEDATA, &kept);
    set(CURLOPT_ERRORBUFFER, error.data());
    if (!configuration_.user.empty()) {
        set(CURLOPT_HTTPAUTH, static_cast<long>(CURLAUTH_BASIC));
        set(CURLOPT_USERNAME, configuration_.user.c_str());
        set(CURLOPT_PASSWORD, configuration_.password.c_str());
    }
    if (!configuration_.certificateAuthority.empty()) {
        set(CURLOPT_CAINFO, configuration_.certificateAuthority.c_str());
        set(CURLOPT_CAPATH, static_cast<const char*>(nullptr)); // those of the system
    }
    if (const CURLcode code = curl_easy_perform(handle); code != CURLE_OK) {
        answer.text = fmt::format("{}: {}", server, error[0] == 0 ? curl_easy_strerror(code) : error.data());
        return answer;
    }
    curl_easy_getinfo(handle, CURLINFO_RESPONSE_CODE, &answer.status);
    if (answer.status != 200)
        answer.text = fmt::format("{} answered {}: {}", server, answer.status, firstLine(answer.text));
    return answer;
}

// What a server answered says more than that another is away.
Answer ClickHouseServers::ask(const std::string& query, std::string_view body,
                              const std::function<bool(const Answer&)>& isFinal)
{
    Answer answer;
    for (std::size_t tried = 0; tried < configuration_.servers.size(); ++tried) {
        Answer next = askServer(configuration_.servers[current_], query, body);
        if (next.status != 0 || answer.status == 0)
            answer = std::move(next);
        if (answer.isGood() || isFinal(answer))
            break;
        current_ = (current_ + 1) % configuration_.servers.size();
    }
    return answer;
}

std::expected<std::uint64_t, std::string> ClickHouseServers::edition()
{
    constexpr int unknownTable = 60;
    constexpr int unknownDatabase = 81;
    Answer answer =
        ask("SELECT max(edition) FROM edition FORMAT TabSeparated", "", [](const Answer&) { return false; });
    if (const int code = exceptionCode(answer.text);
        !answer.isGood() && (code == unknownTable || code == unknownDatabase))
        return 0;
    if (!answer.isGood())
        return std::unexpected(std::move(answer.text));
    std::uint64_t number = 0;
    if (std::from_chars(answer.text.data(), answer.text.data() + answer.text.size(), number).ec != std::errc())
        return std::unexpected(fmt::format("{} answers as ClickHouse does not: {}", configuration_.servers[current_],
                                           firstLine(answer.text)));
    return number;
}

int exceptionCode(std::string_view text) noexcept
{
    constexpr std::string_view word = "Code: ";
    int code = 0;
    if (const std::size_t place = text.find(word); place != std::string_view::npos)
        std::from_chars(text.data() + place + word.size(), text.data() + text.size(), code);
    return code;
}

} // namespace fleet_database
