// SPDX-License-Identifier: Apache-2.0
// The page in a real browser: it has nothing to complain about, and shows the page on light and dark screens.
#include "kesto/report/page/ReportPage.h"
#include "support/TemporaryDirectory.h"
#include "tools/kesto/report/page/Browser.h"
#include "tools/kesto/report/page/MadeReport.h"

#include <filesystem>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <string>

namespace kesto_tool {
namespace {

using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;

class ReportBrowser : public testing::Test {
protected:
    void SetUp() override
    {
        if (!Browser::missing().empty())
            GTEST_SKIP() << Browser::missing();
    }

    std::filesystem::path write(const std::string& page) const
    {
        support::writeFile(directory_ / "page.html", page);
        return directory_ / "page.html";
    }
    std::filesystem::path write(const Report& report) const
    {
        return write(
            reportPage(report, {.host = "living-room", .database = "/store", .timeZone = "UTC", .isUTC = true}));
    }

    support::TemporaryDirectory directory_;
    Browser browser_;
};

TEST_F(ReportBrowser, TellsWhatAPageMayNotDo)
{
    const auto opened = browser_.open(
        write("<!doctype html><meta http-equiv=Content-Security-Policy content=\"default-src 'none'\"><p>seen"
              "<style>p{color:red}</style><script>document.title = 'run'</script><img src='http://127.0.0.1:9/'>"));
    EXPECT_THAT(opened.document, HasSubstr("seen"));
    EXPECT_THAT(opened.messages,
                ElementsAre(HasSubstr("inline style"), HasSubstr("inline script"), HasSubstr("the image")));
}

TEST_F(ReportBrowser, HasNothingToSayAboutThePage)
{
    const MadeReportWish usual{.worst = 10};
    const MadeReportWish oneDay{.days = 1, .applications = 1, .devices = 1, .worst = 1};
    const MadeReportWish quarter{.days = 90, .applications = 60, .devices = 40, .name = std::string(200, '<')};
    for (const auto& [report, expected] :
         {std::pair{madeReport(usual), "application 5"}, std::pair{madeReport(oneDay), "application 1"},
          std::pair{madeReport(quarter), "54 others"}, std::pair{Report{}, "Nothing was played"}}) {
        const auto opened = browser_.open(write(report));
        EXPECT_THAT(opened.messages, IsEmpty());
        EXPECT_THAT(opened.document, HasSubstr(expected));
        EXPECT_THAT(opened.document, HasSubstr("This page runs no script and loads nothing.</p></footer></main>"))
            << "nothing was closed too early";
    }
}

} // namespace
} // namespace kesto_tool
