// SPDX-License-Identifier: Apache-2.0
// Text as it stands in JSON. Nearly all of it needs no escape, so it is looked through eight bytes at a time and
// appended whole.
#pragma once

#include <cstddef>
#include <string>
#include <string_view>

namespace kesto_ingest {

// How many bytes of the text come before the first one that JSON escapes: below 0x20, a quotation mark or a backslash.
[[nodiscard]] std::size_t plainLength(std::string_view text) noexcept;

// With quotation marks around it.
void appendText(std::string_view text, std::string& json);

// JSON without spaces that is itself the content of a text in JSON: each of its quotation marks and backslashes is
// escaped as it is written.
class EmbeddedJson {
public:
    void clear() noexcept { content_.clear(); }
    [[nodiscard]] std::string_view content() const noexcept { return content_; } // without quotation marks around it

    void addKey(std::string_view key)
    {
        addText(key);
        content_ += ':';
    }
    void addText(std::string_view text);
    // A number, true, false or null.
    void addWord(std::string_view word)
    {
        separate();
        content_ += word;
    }
    void open(char bracket)
    {
        separate();
        content_ += bracket;
    }
    void close(char bracket) { content_ += bracket; }

private:
    void separate()
    {
        const char last = content_.empty() ? '{' : content_.back();
        if (last != '{' && last != '[' && last != ':')
            content_ += ',';
    }

    std::string content_;
};

} // namespace kesto_ingest
