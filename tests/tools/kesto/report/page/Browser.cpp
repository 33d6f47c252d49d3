// SPDX-License-Identifier: Apache-2.0
// Chromium as Debian packages it. It gets a network of its own that nothing else is in.
#include "tools/kesto/report/page/Browser.h"

#include "sdk/Process.h"

#include <gtest/gtest.h>
#include <sstream>
#include <unistd.h>

namespace kesto_tool {
namespace {

using sdk_test::run;

std::vector<std::string> withoutNetwork()
{
    return ::geteuid() == 0 ? std::vector<std::string>{"unshare", "--net"}
                            : std::vector<std::string>{"unshare", "--net", "--map-root-user"};
}

std::string findMissing()
{
    if (run({"sh", "-c", "command -v chromium"}).status != 0)
        return "there is no chromium: apt-get install chromium";
    auto probe = withoutNetwork();
    probe.emplace_back("true");
    const auto finished = run(probe);
    return finished.status == 0
        ? std::string()
        : "the browser would have a network: allow this user to make a network namespace (" + finished.errors + ")";
}

} // namespace

const std::string& Browser::missing()
{
    static const std::string missing = findMissing();
    return missing;
}

std::vector<std::string> Browser::command(const std::vector<std::string>& further) const
{
    const std::string home = home_.path();
    std::vector<std::string> whole = withoutNetwork();
    whole.insert(whole.end(),
                 {"env", "HOME=" + home, "TMPDIR=" + home, "chromium", "--headless", "--no-sandbox", "--disable-gpu",
                  "--disable-quic", "--no-first-run", "--disable-background-networking", "--disable-component-update",
                  "--disable-sync", "--disable-dev-shm-usage", "--enable-logging=stderr", "--v=0",
                  "--host-resolver-rules=MAP * ~NOTFOUND", "--user-data-dir=" + home + "/data"});
    whole.insert(whole.end(), further.begin(), further.end());
    return whole;
}

Browser::Opened Browser::open(const std::filesystem::path& page) const
{
    const auto finished = run(command({"--dump-dom", "file://" + page.native()}));
    EXPECT_EQ(finished.status, 0) << finished.errors;
    Opened opened{.document = finished.output, .messages = {}};
    std::istringstream lines(finished.errors);
    for (std::string line; std::getline(lines, line);)
        if (const auto at = line.find(":CONSOLE"); at != std::string::npos)
            opened.messages.push_back(line.substr(at));
    return opened;
}

void Browser::photograph(const std::filesystem::path& page, const std::filesystem::path& image, Screen screen,
                         int height) const
{
    const auto finished = run(command(
        {"--screenshot=" + image.native(), "--window-size=1180," + std::to_string(height), "--hide-scrollbars",
         screen == Screen::Dark ? "--blink-settings=preferredColorScheme=0" : "--blink-settings=preferredColorScheme=1",
         "file://" + page.native()}));
    EXPECT_EQ(finished.status, 0) << finished.errors;
}

} // namespace kesto_tool
