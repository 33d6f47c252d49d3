// SPDX-License-Identifier: Apache-2.0
// The sections of the page, one function and one file each. Each has a heading, a picture, and its figures as a table.
#pragma once

#include "kesto/report/Report.h"

#include <string>
#include <string_view>
#include <vector>

struct PageWords {
    bool isUTC = false; // moments are in UTC, else in the time zone of the process
    bool hasNotes = true; // what a pointer shows at a mark; without them, pictures are coarser, too
    bool isRecording = false;

    [[nodiscard]] std::string_view played() const { return isRecording ? "recorded" : "played"; }
    [[nodiscard]] std::string_view playing() const { return isRecording ? "recording" : "playing"; }
};

[[nodiscard]] std::string timeSection(const Report& report, const PageWords& words);
[[nodiscard]] std::string deviceSection(const Report& report, const PageWords& words);
[[nodiscard]] std::string volumeSection(const Report& report, const PageWords& words);
[[nodiscard]] std::string faultSection(const Report& report, const PageWords& words);
[[nodiscard]] std::string worstSection(const Report& report, const PageWords& words);
// Nothing of the report of a device.
[[nodiscard]] std::string fleetSection(const Report& report, const PageWords& words);

// A table behind a picture, closed until somebody opens it. The first column of each row is its heading. All is HTML.
struct PageTable {
    std::string summary;
    std::vector<std::string> head;
    std::vector<std::vector<std::string>> rows;
};
[[nodiscard]] std::string tableHTML(const PageTable& table);
