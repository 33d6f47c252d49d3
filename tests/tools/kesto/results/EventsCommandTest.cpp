// SPDX-License-Identifier: Apache-2.0
// Reading the event store: as a table, as JSON, filtered, followed, and with errors.
#include "end_to_end/Kestod.h"
#include "end_to_end/WireClient.h"
#include "tools/kesto/Tool.h"

#include <chrono>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <regex>
#include <sqlite3.h>

namespace kesto_tool {
namespace {

namespace fs = std::filesystem;
using testing::EndsWith;
using testing::HasSubstr;
using testing::Not;
using testing::StartsWith;

double now()
{
    return std::chrono::duration<double>(std::chrono::system_clock::now().time_since_epoch()).count();
}

// A database that is open for writing, as the service's is.
class Database {
public:
    explicit Database(const fs::path& path) { EXPECT_EQ(sqlite3_open(path.c_str(), &database_), SQLITE_OK); }
    ~Database() { sqlite3_close(database_); }
    Database(const Database&) = delete;
    Database& operator=(const Database&) = delete;

    void execute(const std::string& sql) const
    {
        EXPECT_EQ(sqlite3_exec(database_, sql.c_str(), nullptr, nullptr, nullptr), SQLITE_OK)
            << sqlite3_errmsg(database_);
    }
    void makeTable() const
    {
        execute("PRAGMA journal_mode = WAL;"
                "CREATE TABLE events (id INTEGER PRIMARY KEY AUTOINCREMENT, time REAL NOT NULL, name TEXT NOT NULL,"
                " payload TEXT NOT NULL) STRICT");
    }
    void add(double time, const std::string& name, const std::string& payload = "{}") const
    {
        char* sql = sqlite3_mprintf("INSERT INTO events (time, name, payload) VALUES (%.17g, %Q, %Q)", time,
                                    name.c_str(), payload.c_str());
        execute(sql);
        sqlite3_free(sql);
    }

private:
    sqlite3* database_ = nullptr;
};

class EventsCommand : public testing::Test {
protected:
    // Makes a store, and adds the events to it.
    std::unique_ptr<Database> makeStore(const fs::path& path, const std::vector<std::string>& names) const
    {
        auto database = std::make_unique<Database>(path);
        database->makeTable();
        for (const std::string& name : names)
            database->add(1000, name);
        return database;
    }
    std::unique_ptr<Database> makeStore(const std::vector<std::string>& names = {}) const
    {
        return makeStore(store, names);
    }
    [[nodiscard]] std::string printJson(Tool::Arguments further = {}) const
    {
        further.insert(further.begin(), {"events", "--json"});
        return tool.print(further);
    }
    // As the service does with a damaged one.
    void moveStoreAway() const
    {
        for (const std::string file : {"", "-wal", "-shm"})
            if (fs::exists(store.native() + file))
                fs::rename(store.native() + file, store.native() + ".corrupt-1" + file);
    }
    void expectFailure(const std::string& reason) const
    {
        const Finished finished = tool.run({"events", "--json"});
        EXPECT_EQ(finished.status, 1);
        EXPECT_EQ(finished.output, "");
        EXPECT_THAT(finished.errors, StartsWith("kesto: "));
        EXPECT_THAT(finished.errors, HasSubstr(reason));
    }

    const support::TemporaryDirectory directory;
    const fs::path store = directory.path() / "state/analytics.sqlite3";
    Tool tool{directory.path()};
};

std::string jsonLine(int id, const std::string& name, const std::string& payload = "{}")
{
    return "{\"id\":" + std::to_string(id) + ",\"time\":1000,\"name\":\"" + name + "\",\"payload\":" + payload + "}\n";
}

// --- the table

TEST_F(EventsCommand, ShowsATableWithAColumnForTheApplication)
{
    const auto database = makeStore();
    database->add(1767225600.25, "com.quarn.kesto.Playback.Start",
                  R"({"volume":0.5,"HostApplicationDisplayID":"org.player","on":true,"inner":{"a":[1]}})");
    database->add(1767225601, "com.quarn.kesto.kestoreportingclientuptime", R"({"processName":"player","seconds":7})");
    database->add(1767225602, "org.other", "no JSON");
    EXPECT_EQ(tool.print({"events"}),
              "TIME                    EVENT                              APPLICATION            PAYLOAD\n"
              "2026-01-01 00:00:00.250 kesto.Playback.Start               org.player             "
              "volume=0.5 on=true inner={\"a\":[1]}\n"
              "2026-01-01 00:00:01.000 kesto.kestoreportingclientuptime   player                 seconds=7\n"
              "2026-01-01 00:00:02.000 org.other                                                 no JSON\n");
}

TEST_F(EventsCommand, ShowsTheHeadOfATableWithoutEvents)
{
    const auto database = makeStore();
    EXPECT_THAT(tool.print({"events"}), EndsWith("PAYLOAD\n"));
    EXPECT_EQ(printJson(), "");
}

TEST_F(EventsCommand, CutsTheTableToTheWidthOfTheTerminalBetweenCharacters)
{
    const auto database = makeStore();
    database->add(1000, "com.quarn.kesto.a.name.that.is.longer.than.its.column", R"({"a":"äöüäöüäöüäöüäöüäöü"})");
    tool.setVariable("COLUMNS=100");
    EXPECT_THAT(tool.print({"events"}), HasSubstr(" kesto.a.name.that.is.longer.than.… "));
    EXPECT_THAT(tool.print({"events"}), EndsWith(" a=äöüäöüäöüäöüäöü…\n"));
    tool.setVariable("COLUMNS=1");
    EXPECT_THAT(tool.print({"events"}), EndsWith(" a=äöüäö…\n")) << "something always";
    tool.setVariable("COLUMNS=");
    EXPECT_THAT(tool.print({"events"}), EndsWith("äöüäöü\n")) << "an empty variable counts as not set";
}

TEST_F(EventsCommand, KeepsControlCharactersFromTheTerminal)
{
    const auto database = makeStore();
    database->add(1000,
                  "a\x1B[2Jb\xC2\x9B"
                  "c",
                  R"({"HostApplicationDisplayID":"\u001b]0;title\u0007","k\ney":"\u009b31m\u007f"})");
    const std::string table = tool.print({"events"});
    EXPECT_THAT(table, HasSubstr("a?[2Jb?c "));
    EXPECT_THAT(table, HasSubstr("?]0;title? "));
    EXPECT_THAT(table, HasSubstr("k?ey=?31m?\n"));
    EXPECT_THAT(table, Not(HasSubstr("\x1B")));
}

TEST_F(EventsCommand, PrintsJsonLinesForPrograms)
{
    const auto database = makeStore();
    database->add(1767225600.25, "a\"b\n", R"({"a":"\n\u001b","b":[0.1]})");
    EXPECT_EQ(
        printJson(),
        "{\"id\":1,\"time\":1767225600.25,\"name\":\"a\\\"b\\n\",\"payload\":{\"a\":\"\\n\\u001b\",\"b\":[0.1]}}\n");
}

// --- filters

TEST_F(EventsCommand, FiltersByName)
{
    const auto database = makeStore({"com.a.Start", "com.b.Start", "com.a.Stop", "com.'a"});
    EXPECT_EQ(printJson({"--name", "com.a.*"}), jsonLine(1, "com.a.Start") + jsonLine(3, "com.a.Stop"));
    EXPECT_EQ(printJson({"--name", "com.?.Start"}), jsonLine(1, "com.a.Start") + jsonLine(2, "com.b.Start"));
    EXPECT_EQ(printJson({"--name", "com.'a"}), jsonLine(4, "com.'a"));
}

TEST_F(EventsCommand, FiltersByNameWithoutTheirPrefix)
{
    const auto database = makeStore(
        {"com.quarn.kesto.Playback.Start", "kesto.Playback.Start", "com.quarn.kesto.Playback.Stop", "x.kesto"});
    EXPECT_EQ(printJson({"--name", "kesto.Playback.Start"}),
              jsonLine(1, "com.quarn.kesto.Playback.Start") + jsonLine(2, "kesto.Playback.Start"));
    EXPECT_EQ(printJson({"--name", "kesto.*"}),
              jsonLine(1, "com.quarn.kesto.Playback.Start") + jsonLine(2, "kesto.Playback.Start")
                  + jsonLine(3, "com.quarn.kesto.Playback.Stop"));
    EXPECT_EQ(printJson({"--name", "com.quarn.kesto.*.Start"}), jsonLine(1, "com.quarn.kesto.Playback.Start"));
}

TEST_F(EventsCommand, SaysThatNoNameMatches)
{
    const auto database = makeStore({"com.a.Start"});
    const auto expectNothing = [this](const Tool::Arguments& arguments, const std::string& errors) {
        const Finished finished = tool.run(arguments);
        EXPECT_EQ(finished.status, 0);
        EXPECT_EQ(finished.output, "");
        EXPECT_EQ(finished.errors, errors);
    };
    expectNothing({"events", "--json", "--name", "com"}, "kesto: no event has a name that matches 'com'\n");
    expectNothing({"events", "--json", "--name", "com.a.*", "--since", "2026-01-31"},
                  "kesto: no event of that time has a name that matches 'com.a.*'\n");
    expectNothing({"events", "--json", "--name", "a\x1B[2J"}, "kesto: no event has a name that matches 'a?[2J'\n");
    expectNothing({"events", "--json", "--since", "2026-01-31"}, "");
    expectNothing({"events", "--json", "--name", "com.a.*", "--count", "0"}, "");
}

TEST_F(EventsCommand, FiltersByTime)
{
    const auto database = makeStore();
    database->add(now() - 3600, "old");
    database->add(now() - 60, "new");
    EXPECT_THAT(printJson({"--since", "10m"}), testing::AllOf(HasSubstr("new"), Not(HasSubstr("old"))));
    EXPECT_THAT(printJson({"--since", "2h"}), HasSubstr("old"));
    EXPECT_EQ(printJson({"--since", "1s"}), "");
    EXPECT_THAT(printJson({"--since", "2026-01-31T18:00:00+01:00"}), HasSubstr("old"));
    EXPECT_EQ(printJson({"--since", "9999-01-31"}), "");
}

TEST_F(EventsCommand, ShowsTheMostRecentOnesInTheOrderInWhichTheyCame)
{
    const auto database = makeStore({"a", "b", "c"});
    EXPECT_EQ(printJson({"--count", "2"}), jsonLine(2, "b") + jsonLine(3, "c"));
    EXPECT_EQ(printJson({"--count", "0"}), "");
    EXPECT_EQ(printJson({"--count", "9"}), jsonLine(1, "a") + jsonLine(2, "b") + jsonLine(3, "c"));
    EXPECT_EQ(printJson({"--count", "1", "--name", "[ab]"}), jsonLine(2, "b"));
}

// --- the store's place

TEST_F(EventsCommand, FindsTheStoreThatIsNamed)
{
    makeStore({"state"});
    const fs::path other = directory.path() / "a ?b#c%41.sqlite3";
    makeStore(other, {"other"});
    EXPECT_EQ(printJson({"--database", other}), jsonLine(1, "other"));
    EXPECT_EQ(printJson(), jsonLine(1, "state"));
    tool.setVariable("STATE_DIRECTORY=" + (directory.path() / "state").native() + ":/nonexistent");
    EXPECT_EQ(printJson(), jsonLine(1, "state"));
    tool.setVariable("STATE_DIRECTORY");
    fs::create_directories(directory.path() / "home/.local/state/kesto");
    makeStore(directory.path() / "home/.local/state/kesto/analytics.sqlite3", {"home"});
    EXPECT_EQ(printJson(), jsonLine(1, "home"));
    tool.setVariable("XDG_STATE_HOME=" + (directory.path() / "xdg").native());
    EXPECT_EQ(printJson(), jsonLine(1, "home")) << "where there is one";
    fs::create_directories(directory.path() / "xdg/kesto");
    makeStore(directory.path() / "xdg/kesto/analytics.sqlite3", {"xdg"});
    EXPECT_EQ(printJson(), jsonLine(1, "xdg"));
}

TEST_F(EventsCommand, ReadsAStoreWithoutAWriterAndLeavesNoTrace)
{
    makeStore({"a"}); // closed, which removes its log
    ASSERT_FALSE(fs::exists(store.native() + "-wal"));
    fs::permissions(store.parent_path(), fs::perms(0555));
    tool.giveUpRights();
    EXPECT_EQ(printJson(), jsonLine(1, "a"));
    fs::permissions(store.parent_path(), fs::perms(0755));
    EXPECT_EQ(std::distance(fs::directory_iterator(store.parent_path()), fs::directory_iterator()), 1);
}

TEST_F(EventsCommand, ReadsAStoreThatIsBeingWritten)
{
    const auto database = makeStore({"a"});
    ASSERT_TRUE(fs::exists(store.native() + "-wal"));
    database->execute("BEGIN IMMEDIATE");
    database->add(1000, "b");
    EXPECT_EQ(printJson(), jsonLine(1, "a"));
    database->execute("COMMIT");
    EXPECT_EQ(printJson(), jsonLine(1, "a") + jsonLine(2, "b"));
}

// --- failures

TEST_F(EventsCommand, SaysThatTheStoreIsMissing)
{
    expectFailure("the event store " + store.native() + " does not exist: has kestod run?");
}

TEST_F(EventsCommand, SaysThatItMayNotReadTheStore)
{
    makeStore({"a"});
    tool.giveUpRights();
    fs::permissions(store, fs::perms(0000));
    expectFailure("cannot read the event store " + store.native()
                  + ": permission denied: members of the group kesto may read it");
    fs::permissions(store.parent_path(), fs::perms(0000));
    expectFailure("cannot read the event store " + store.native()
                  + ": permission denied: members of the group kesto may read it");
    fs::permissions(store.parent_path(), fs::perms(0755));
}

TEST_F(EventsCommand, SaysThatAFileIsNotADatabase)
{
    support::writeFile(store, std::string(10'000, 'x'));
    expectFailure("file is not a database");
    support::writeFile(store, "");
    expectFailure("no such table: events");
    fs::remove(store);
    fs::create_directory(store);
    expectFailure("cannot read the event store");
}

TEST_F(EventsCommand, SaysThatADatabaseIsAnothers)
{
    Database(store).execute("CREATE TABLE songs (title TEXT)");
    expectFailure("no such table: events");
    Database(store).execute("CREATE TABLE events (title TEXT)");
    expectFailure("no such column: id");
}

TEST_F(EventsCommand, ShowsWhatItCanReadOfADamagedStoreAndFails)
{
    {
        const auto database = makeStore();
        for (int number = 0; number < 500; ++number)
            database->add(1000, "event", "{\"text\":\"" + std::string(200, 'x') + "\"}");
    }
    std::string bytes = support::readFile(store);
    ASSERT_GT(bytes.size(), 60'000U);
    bytes.replace(bytes.size() / 2, bytes.size() / 2, std::string(bytes.size() / 2, '\xFF'));
    support::writeFile(store, bytes);
    const Finished finished = tool.run({"events"});
    EXPECT_EQ(finished.status, 1);
    EXPECT_THAT(finished.errors, HasSubstr("malformed"));
}

TEST_F(EventsCommand, SaysThatTheStoreIsLocked)
{
    const auto database = makeStore({"a"});
    database->execute("PRAGMA locking_mode = EXCLUSIVE; BEGIN EXCLUSIVE; INSERT INTO events (time, name, payload)"
                      " VALUES (1, 'b', '{}'); COMMIT");
    expectFailure("database is locked");
}

// --- following

TEST_F(EventsCommand, FollowsWhatComes)
{
    const auto database = makeStore({"a"});
    const auto follower = tool.start({"events", "--json", "--follow", "--name", "[a-c]"});
    EXPECT_EQ(follower->waitForOutput("\n"), jsonLine(1, "a"));
    for (const char* name : {"b", "x", "c"})
        database->add(1000, name);
    EXPECT_EQ(follower->waitForOutput("\"c\""), jsonLine(1, "a") + jsonLine(2, "b") + jsonLine(4, "c"));
    follower->signal(SIGINT);
    EXPECT_EQ(follower->wait(), 128 + SIGINT);
    EXPECT_EQ(follower->errors(), "");
}

TEST_F(EventsCommand, FollowsFromTheMostRecentOnes)
{
    const auto database = makeStore({"a", "b"});
    const auto last = tool.start({"events", "--json", "--follow", "--count", "1"});
    EXPECT_EQ(last->waitForOutput("\n"), jsonLine(2, "b"));
    const auto none = tool.start({"events", "--follow", "--count", "0"});
    EXPECT_THAT(none->waitForOutput("\n"), EndsWith("PAYLOAD\n"));
    database->add(1000, "c");
    EXPECT_EQ(last->waitForOutput("\"c\""), jsonLine(2, "b") + jsonLine(3, "c"));
    EXPECT_THAT(none->waitForOutput("1970"),
                EndsWith("PAYLOAD\n1970-01-01 00:16:40.000 c" + std::string(57, ' ') + "\n"));
}

TEST_F(EventsCommand, LosesNoCommitOfManyWhileFollowing)
{
    const auto database = makeStore();
    const auto follower = tool.start({"events", "--json", "--follow"});
    constexpr int count = 500;
    std::string expected;
    for (int number = 1; number <= count; ++number) {
        database->add(1000, "event");
        expected += jsonLine(number, "event");
    }
    EXPECT_EQ(follower->waitForOutput("{\"id\":500,\"time\":1000,\"name\":\"event\",\"payload\":{}}\n"), expected);
}

TEST_F(EventsCommand, FollowsAStoreThatHadNoWriter)
{
    makeStore({"a"});
    const auto follower = tool.start({"events", "--json", "--follow"});
    EXPECT_EQ(follower->waitForOutput("\n"), jsonLine(1, "a"));
    const Database again(store);
    again.add(1000, "b");
    EXPECT_EQ(follower->waitForOutput("\"b\""), jsonLine(1, "a") + jsonLine(2, "b"));
}

TEST_F(EventsCommand, FollowsTheStoreThatTakesThePlaceOfTheOneItReads)
{
    auto database = makeStore({"a", "b"});
    const auto follower = tool.start({"events", "--json", "--follow"});
    EXPECT_EQ(follower->waitForOutput("\"b\""), jsonLine(1, "a") + jsonLine(2, "b"));
    database.reset();
    moveStoreAway();
    database = makeStore({"c"}); // step by step: for a moment it is not a store yet
    EXPECT_THAT(follower->waitForOutput("\"c\""), EndsWith(jsonLine(1, "c")));
    database->add(1000, "d");
    EXPECT_THAT(follower->waitForOutput("\"d\""), EndsWith(jsonLine(1, "c") + jsonLine(2, "d")));
    EXPECT_EQ(follower->errors(), "");
}

// There `events` is a view, in which a message is two events.
TEST_F(EventsCommand, ReadsTheStoreOfARealService)
{
    end_to_end::Kestod kestod;
    kestod.start();
    end_to_end::WireClient client(kestod.socketPath());
    for (int number = 1; number <= 2; ++number)
        client.ask(end_to_end::SendMessage, foundation::Dictionary{{"a", number}}, 4, 1, foundation::Value());
    const auto read = [&](Tool::Arguments further) {
        further.insert(further.begin(),
                       {"events", "--json", "--database", kestod.directory() / "state/analytics.sqlite3"});
        const std::string text =
            std::regex_replace(tool.print(further), std::regex(R"("time":[0-9]{10}[.0-9]*)"), R"("time":0)");
        return std::regex_replace(text, std::regex(R"("cursor":"[0-9a-f]{32}:)"), R"("cursor":"EPOCH:)");
    };
    const auto line = [](int id, const std::string& name, int number) {
        return "{\"id\":" + std::to_string(id) + ",\"time\":0,\"name\":\"com.quarn." + name
            + "\",\"payload\":{\"a\":" + std::to_string(number)
            + ",\"HostApplicationDisplayID\":\"Unknown\"},\"cursor\":\"EPOCH:" + std::to_string(id) + "\"}\n";
    };
    const std::string own = "kesto.Playback.Start";
    const std::string ofService = "standalone.Playback.Start";
    EXPECT_EQ(read({}), line(1, own, 1) + line(2, ofService, 1) + line(3, own, 2) + line(4, ofService, 2));
    EXPECT_EQ(read({"--name", "*.standalone.*"}), line(2, ofService, 1) + line(4, ofService, 2));
    EXPECT_EQ(read({"--count", "1"}), line(4, ofService, 2));
    EXPECT_EQ(read({"--since", "9999-01-31"}), "");
}

// --- cursors

class EventsBehindACursor : public EventsCommand {
protected:
    // A database as the service makes it now, as far as cursors concern it.
    void makeStoreOf(const std::string& epoch, const std::vector<std::string>& names)
    {
        database = makeStore(names);
        database->execute("CREATE TABLE store(epoch TEXT NOT NULL) STRICT; INSERT INTO store VALUES ('" + epoch + "')");
    }
    static std::string line(int id, const std::string& name, const std::string& epoch = "e1")
    {
        std::string text = jsonLine(id, name);
        return text.insert(text.size() - 2, ",\"cursor\":\"" + epoch + ":" + std::to_string(id) + "\"");
    }

    std::unique_ptr<Database> database;
};

TEST_F(EventsBehindACursor, AreReadPieceByPieceFromTheOldestOne)
{
    makeStoreOf("e1", {"a", "b", "c", "d", "e"});
    EXPECT_EQ(printJson({"--after", "", "--count", "2"}), line(1, "a") + line(2, "b"));
    EXPECT_EQ(printJson({"--after", "e1:2", "--count", "2"}), line(3, "c") + line(4, "d"));
    EXPECT_EQ(printJson({"--after", "e1:4", "--count", "2"}), line(5, "e"));
    EXPECT_EQ(printJson({"--after", "e1:5", "--count", "2"}), "");
    database->add(1000, "f");
    EXPECT_EQ(printJson({"--after", "e1:5", "--name", "[ef]"}), line(6, "f"));
}

TEST_F(EventsBehindACursor, AreOnlyThoseToComeWithoutAnyOfThePresentOnes)
{
    makeStoreOf("e1", {"a", "b", "c"});
    const auto follower = tool.start({"events", "--follow", "--after", "e1:1", "--count", "0"});
    EXPECT_THAT(follower->waitForOutput("\n"), EndsWith("PAYLOAD\n"));
    database->add(1000, "d");
    EXPECT_THAT(follower->waitForOutput("1970"),
                EndsWith("PAYLOAD\n1970-01-01 00:16:40.000 d" + std::string(57, ' ') + "\n"));
}

TEST_F(EventsBehindACursor, AreAllOfAnotherDatabaseThatTookThePlaceOfTheFirst)
{
    makeStoreOf("e2", {"a", "b"});
    const Finished finished = tool.run({"events", "--json", "--after", "e1:1"});
    EXPECT_EQ(finished.output, line(1, "a", "e2") + line(2, "b", "e2"));
    EXPECT_EQ(finished.errors, "kesto: the cursor is of another event store: this one begins with its oldest event\n");
    EXPECT_EQ(finished.status, 0);
}

TEST_F(EventsBehindACursor, AreThoseOfTheNewDatabaseOnceItTakesThePlaceOfTheOneThatIsFollowed)
{
    makeStoreOf("e1", {"a", "b"});
    const auto follower = tool.start({"events", "--json", "--follow", "--after", "e1:1"});
    EXPECT_EQ(follower->waitForOutput("\"b\""), line(2, "b"));
    const fs::path next = directory.path() / "state/next.sqlite3";
    makeStore(next, {"c"})->execute("CREATE TABLE store(epoch TEXT NOT NULL) STRICT; INSERT INTO store VALUES ('e2')");
    database.reset();
    moveStoreAway();
    fs::rename(next, store);
    EXPECT_EQ(follower->waitForOutput("\"c\""), line(2, "b") + line(1, "c", "e2"));
}

TEST_F(EventsBehindACursor, AreAllOfADatabaseThatWasRepairedWhileItIsFollowed)
{
    makeStoreOf("e1", {"b", "c"});
    const auto follower = tool.start({"events", "--json", "--follow", "--after", "e1:1"});
    EXPECT_EQ(follower->waitForOutput("\"c\""), line(2, "c"));
    database->execute("UPDATE store SET epoch = 'e2'");
    database->add(1000, "d");
    EXPECT_THAT(follower->waitForOutput("\"d\""),
                EndsWith(line(1, "b", "e2") + line(2, "c", "e2") + line(3, "d", "e2")));
}

TEST_F(EventsBehindACursor, AreNotToldOfAStoreWithoutCursors)
{
    const auto first = makeStore({"a"});
    EXPECT_EQ(printJson({"--after", ""}), jsonLine(1, "a"));
    const Finished finished = tool.run({"events", "--after", "e1:1"});
    EXPECT_EQ(finished.status, 1);
    EXPECT_THAT(finished.errors, HasSubstr(" has no cursors: an earlier version of kestod made it."));
}

TEST_F(EventsBehindACursor, AreNotReadForWhatIsNoCursor)
{
    makeStoreOf("e1", {"a"});
    for (const char* wrong : {"7", ":7", "e1:", "e1:x", "e1:7x", "e1:-1"}) {
        const Finished finished = tool.run({"events", "--after", wrong});
        EXPECT_NE(finished.status, 0) << wrong;
        EXPECT_THAT(finished.errors, HasSubstr(std::string("\"") + wrong + "\" is not a cursor: give that of a line"));
    }
}

TEST_F(EventsCommand, FollowsARealService)
{
    end_to_end::Kestod kestod;
    kestod.start();
    end_to_end::WireClient client(kestod.socketPath());
    client.ask(end_to_end::SendMessage, foundation::Dictionary{{"a", 1}}, 4, 1, foundation::Value());
    const auto follower =
        tool.start({"events", "--follow", "--database", kestod.directory() / "state/analytics.sqlite3"});
    EXPECT_THAT(follower->waitForOutput("standalone.Playback.Start"), HasSubstr("Unknown"));
    client.ask(end_to_end::SendMessage, foundation::Dictionary{{"a", 2}}, 4, 2, foundation::Value());
    EXPECT_THAT(follower->waitForOutput("standalone.Playback.Stop"), HasSubstr("a=1"));
    EXPECT_THAT(follower->waitForOutput("a=2"), HasSubstr("kesto.Playback.Stop "));
}

TEST_F(EventsCommand, EndsWhenItsOutputHasNoReader)
{
    const auto database = makeStore({"a"});
    const Finished finished = tool.runShell("$kesto events --follow >/dev/full");
    EXPECT_EQ(finished.status, 1);
    EXPECT_EQ(finished.errors, "kesto: the output could not be written\n");
}

} // namespace
} // namespace kesto_tool
