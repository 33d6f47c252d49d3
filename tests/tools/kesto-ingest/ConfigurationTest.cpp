// SPDX-License-Identifier: Apache-2.0
// What ingest.toml may say, and what is said of one that is wrong.
#include "kesto-ingest/Configuration.h"

#include "support/ManualPage.h"
#include "support/TemporaryDirectory.h"

#include <gtest/gtest.h>

namespace kesto_ingest {
namespace {

class IngestConfiguration : public testing::Test {
protected:
    [[nodiscard]] std::expected<Configuration, std::string> read(std::string_view text)
    {
        support::writeFile(directory / "ingest.toml", text);
        return readConfiguration(directory / "ingest.toml");
    }
    // What is said of the text, without the name of the file.
    [[nodiscard]] std::string problem(std::string_view text)
    {
        const auto configuration = read(text);
        const std::string beginning = (directory / "ingest.toml").native() + ": ";
        EXPECT_TRUE(!configuration && configuration.error().starts_with(beginning)) << text;
        return configuration ? "" : configuration.error().substr(beginning.size());
    }

    support::TemporaryDirectory directory;
};

TEST_F(IngestConfiguration, HasDefaults)
{
    const auto configuration = read("");
    ASSERT_TRUE(configuration);
    EXPECT_EQ(configuration->stream.servers, std::vector<std::string>{"nats://127.0.0.1:4222"});
    EXPECT_EQ(configuration->database.servers, std::vector<std::string>{"http://127.0.0.1:8123"});
    EXPECT_EQ(configuration->database.database, "kesto");
    EXPECT_EQ(configuration->rowsInABlock, 10'000U);
    EXPECT_EQ(configuration->longestJoining.count(), 1000);
    EXPECT_EQ(configuration->metricsPort, 9464);
}

TEST_F(IngestConfiguration, TheExampleShowsEveryDefault)
{
    const auto example = readConfiguration(KESTO_INGEST_EXAMPLE);
    ASSERT_TRUE(example) << example.error();
    EXPECT_EQ(*example, Configuration());
}

TEST_F(IngestConfiguration, TheManualPageDescribesEveryKey)
{
    std::vector<std::string> known;
    for (const std::string table : {"stream", "database", "batches", "metrics"})
        for (const std::string& key : support::keysIn(problem("[" + table + "]\nno_such_key = 1\n")))
            known.push_back(key);
    EXPECT_EQ(support::keysOnPage(KESTO_INGEST_MANUAL), known);
}

TEST_F(IngestConfiguration, IsRead)
{
    support::writeFile(directory / "secret", "user = \"u\"\npassword = \"p\"\n");
    std::filesystem::permissions(directory / "secret", std::filesystem::perms::owner_read);
    const std::string secret = "credentials = \"" + (directory / "secret").native() + "\"\n";
    const auto configuration = read("[stream]\nservers = [\"tls://a:4222\", \"nats://b\"]\ntime_limit_seconds = 2.5\n"
                                    "certificate_authority = \"/ca\"\n"
                                    + secret + "[database]\nservers = [\"https://a:8443/\"]\nname = \"other\"\n"
                                    + "time_limit_seconds = 20\nsettings = { insert_quorum = 2, x = \"y\" }\n" + secret
                                    + "[batches]\nrows = 100\nseconds = 0.5\n[metrics]\nport = 1234\n");
    ASSERT_TRUE(configuration) << configuration.error();
    EXPECT_EQ(configuration->stream.servers, (std::vector<std::string>{"tls://a:4222", "nats://b"}));
    EXPECT_EQ(configuration->stream.timeLimit.count(), 2500);
    EXPECT_EQ(configuration->stream.certificateAuthority, "/ca");
    EXPECT_EQ(configuration->stream.user, "u");
    EXPECT_EQ(configuration->stream.password, "p");
    EXPECT_EQ(configuration->database.servers, std::vector<std::string>{"https://a:8443"});
    EXPECT_EQ(configuration->database.database, "other");
    EXPECT_EQ(configuration->database.timeLimit.count(), 20);
    EXPECT_EQ(configuration->database.settings,
              (std::map<std::string, std::string>{{"insert_quorum", "2"}, {"x", "y"}}));
    EXPECT_EQ(configuration->database.user, "u");
    EXPECT_EQ(configuration->rowsInABlock, 100U);
    EXPECT_EQ(configuration->longestJoining.count(), 500);
    EXPECT_EQ(configuration->metricsPort, 1234);
}

TEST_F(IngestConfiguration, NamesWhatIsWrong)
{
    EXPECT_EQ(problem("[metric]\nport = 1\n"),
              "there is no [metric]; the tables are [stream], [database], [batches] and [metrics]");
    EXPECT_EQ(problem("rows = 7\n"),
              "there is no [rows]; the tables are [stream], [database], [batches] and [metrics]");
    EXPECT_EQ(problem("[batches]\nrow = 7\n"), "unknown key row in [batches]; the keys are rows, seconds");
    EXPECT_EQ(problem("[batches]\nrows = 0\n"), "batches.rows = 0 should be a number from 1 to 100000");
    EXPECT_EQ(problem("[metrics]\nport = true\n"), "metrics.port = 1 should be a number from 0 to 65535");
    EXPECT_EQ(problem("[stream]\nservers = []\n"),
              R"(stream.servers = [] should be a list such as ["nats://127.0.0.1:4222"])");
    EXPECT_EQ(problem("[database]\nservers = [\"ftp://a\"]\n"),
              R"(database.servers = ["ftp://a"] should be a list such as ["http://127.0.0.1:8123"])");
    EXPECT_TRUE(problem("[batches\n").starts_with("line 1: "));
    EXPECT_EQ(readConfiguration(directory / "none.toml").error(),
              (directory / "none.toml").native() + ": No such file or directory");
}

TEST_F(IngestConfiguration, RefusesCredentialsThatEverybodyMayRead)
{
    const std::string secret = directory / "secret";
    support::writeFile(secret, "user = \"u\"\n");
    std::filesystem::permissions(secret, std::filesystem::perms(0644));
    EXPECT_EQ(read("[stream]\ncredentials = \"" + secret + "\"\n").error(),
              secret + ": everybody may read it: chmod o-r");
    std::filesystem::permissions(secret, std::filesystem::perms(0600));
    support::writeFile(secret, "usr = \"u\"\n");
    EXPECT_EQ(read("[database]\ncredentials = \"" + secret + "\"\n").error(),
              secret + ": usr is not one of user, password, each a text");
}

} // namespace
} // namespace kesto_ingest
