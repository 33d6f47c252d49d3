// SPDX-License-Identifier: Apache-2.0
// libkesto as its users get it: installed, found with pkg-config or CMake, and linked by programs outside of the source
// tree. The examples must compile without a warning, and report as they describe.
#include "kesto/kesto.h"
#include "sdk/PlayTimes.h"
#include "support/TemporaryDirectory.h"

#include <filesystem>
#include <fstream>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sstream>

namespace {

using sdk_test::Finished;
using sdk_test::Process;
using sdk_test::run;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::StartsWith;

const std::string buildDirectory = KESTO_BUILD_DIRECTORY;
const std::string examples = KESTO_EXAMPLES_DIRECTORY;
const std::string sanitizers = KESTO_SANITIZERS; // what the library needs from a program that links it

std::vector<std::string> words(const std::string& text)
{
    std::istringstream stream(text);
    return {std::istream_iterator<std::string>(stream), {}};
}

class ExamplesTest : public testing::Test {
protected:
    // Installs the library once for all of these tests, and moves the installation, which must be found at its new
    // place.
    static void SetUpTestSuite()
    {
        directory_ = std::make_unique<support::TemporaryDirectory>();
        const std::string first = *directory_ / "first";
        const Finished installed = run({KESTO_CMAKE, "--install", buildDirectory + "/sdk", "--prefix", first});
        ASSERT_EQ(installed.status, 0) << installed.output << installed.errors;
        std::filesystem::rename(first, prefix());
    }
    static void TearDownTestSuite() { directory_.reset(); }

    static std::string prefix() { return *directory_ / "moved"; }
    static std::string library() { return prefix() + "/" + KESTO_LIBRARY_DIRECTORY; }

    static std::vector<std::string> pkgConfig(const std::vector<std::string>& options)
    {
        Process::Arguments arguments{"pkg-config"};
        arguments.insert(arguments.end(), options.begin(), options.end());
        arguments.emplace_back("kesto");
        const Finished found = run(arguments, {}, {"PKG_CONFIG_PATH=" + library() + "/pkgconfig"});
        EXPECT_EQ(found.status, 0) << found.errors;
        return words(found.output);
    }

    // Compiles and links with what pkg-config says.
    static void compile(Process::Arguments command, const std::vector<std::string>& pkgConfigOptions)
    {
        for (const auto& extra : {words(sanitizers), pkgConfig(pkgConfigOptions)})
            command.insert(command.end(), extra.begin(), extra.end());
        const Finished compiled = run(command);
        ASSERT_EQ(compiled.status, 0) << compiled.errors;
        EXPECT_EQ(compiled.errors, "");
    }

    // Runs a program with a service that computes play times. It ends well and says nothing but this.
    static void runWith(const end_to_end::Kestod& service, const std::string& program, const std::string& output)
    {
        Process::Environment environment = sdk_test::surroundings(service);
        environment.push_back("LD_LIBRARY_PATH=" + library());
        const Finished played = run({program}, {}, environment);
        EXPECT_EQ(played.status, 0) << played.errors;
        EXPECT_EQ(played.errors, "");
        EXPECT_EQ(played.output, output);
    }

    // What the service stores of each player.
    static void expectPlayInC(const std::string& program)
    {
        end_to_end::Kestod service(sdk_test::internalBuild());
        service.startAndAwait();
        runWith(service, program, "");
        EXPECT_THAT(sdk_test::playTimes(service, 4),
                    ElementsAre("2.0 s at 1 on speaker as S16LE/44100/2, 2 channels, by org.example.player",
                                "4.0 s at 0.5 on speaker as S16LE/44100/2, 2 channels, by org.example.player",
                                "1.0 s at 0.5 on speaker as S16LE/44100/2, 2 channels, by org.example.player",
                                "5.0 s at 0.5 on headset as S16LE/44100/2, 2 channels, by org.example.player"));
        EXPECT_THAT(sdk_test::messagesWith(service, "session_duration", 1), ElementsAre("Playback.Deactivate 13.0"));
    }
    static void expectPlayInCPlusPlus(const std::string& program)
    {
        end_to_end::Kestod service(sdk_test::internalBuild());
        service.startAndAwait();
        runWith(service, program, "");
        EXPECT_THAT(sdk_test::playTimes(service, 4),
                    ElementsAre("3.0 s at 0.8 on hdmi as F32LE/48000/6, 6 channels, by org.example.player",
                                "2.0 s at 0 on hdmi as F32LE/48000/6, 6 channels, by org.example.player",
                                "1.0 s at 0.8 on hdmi as F32LE/48000/6, 6 channels, by org.example.player",
                                "6.0 s at 0.8 on hdmi,speaker as F32LE/48000/2, 2 channels, by org.example.player"));
        EXPECT_THAT(sdk_test::messagesWith(service, "late_cycles", 1), ElementsAre("Error.IssueDetector 12.0"));
    }

    // Runs a driver helper. Its channels must exist as long as it runs.
    static void expectPublishes(const std::string& program)
    {
        const support::TemporaryDirectory runtime;
        const std::string tree = runtime / "channels";
        Process helper({program}, {"KESTO_CHANNEL_ROOT=" + tree, "LD_LIBRARY_PATH=" + library()});
        EXPECT_EQ(helper.waitForOutput("\n"), "published; press return to take it away\n");
        EXPECT_EQ(contentOf(tree + "/mixer/Tx/-/late cycles"), "simple\n49\n");
        EXPECT_EQ(contentOf(tree + "/mixer/Tx/-/cycle time"),
                  "histogram us\n0 1980\n0 100 5\n100 1000 45\n1000 10000 50\n");
        EXPECT_THAT(contentOf(tree + "/mixer/Speaker/-/state"), StartsWith("state\nIdle 1 "));
        helper.write("\n");
        EXPECT_EQ(helper.wait(), 0);
        EXPECT_EQ(helper.errors(), "");
        EXPECT_TRUE(std::filesystem::is_empty(tree));
    }
    // The content of a channel's file behind its owner's line.
    static std::string contentOf(const std::string& path)
    {
        std::ifstream file(path);
        std::string owner;
        std::getline(file, owner);
        EXPECT_THAT(owner, testing::MatchesRegex("owner [0-9a-f]{16}"));
        std::ostringstream text;
        text << file.rdbuf();
        return text.str();
    }

    static inline std::unique_ptr<support::TemporaryDirectory> directory_;
};

TEST_F(ExamplesTest, PkgConfigFindsTheLibraryWhereItWasMovedTo)
{
    const auto flags = pkgConfig({"--cflags", "--libs"});
    EXPECT_THAT(flags, testing::Contains("-lkesto"));
    EXPECT_EQ(pkgConfig({"--modversion"}).front(), kesto_version());
    const std::string moved = std::filesystem::canonical(prefix()).string();
    for (const std::string& flag : flags) {
        if (flag.starts_with("-I") || flag.starts_with("-L")) {
            EXPECT_THAT(std::filesystem::weakly_canonical(flag.substr(2)).string(), StartsWith(moved));
        }
    }
}

TEST_F(ExamplesTest, ThePlayerInCReportsWhatItPlays)
{
    const std::string program = *directory_ / "player_c";
    compile({KESTO_C_COMPILER, "-std=c11", "-Wall", "-Wextra", "-Wpedantic", "-Werror", examples + "/player.c", "-o",
             program},
            {"--cflags", "--libs"});
    expectPlayInC(program);
}

TEST_F(ExamplesTest, ThePlayerInOlderCPlusPlusReportsWhatItPlays)
{
    const std::string program = *directory_ / "player_cpp";
    compile({KESTO_CXX_COMPILER, "-std=c++17", "-fno-rtti", "-Wall", "-Wextra", "-Wpedantic", "-Wshadow",
             "-Wold-style-cast", "-Wconversion", "-Werror", examples + "/player.cpp", "-o", program},
            {"--cflags", "--libs"});
    expectPlayInCPlusPlus(program);
}

TEST_F(ExamplesTest, TheSessionOfPlainCallsReportsWhatItPlays)
{
    const std::string program = *directory_ / "session";
    compile({KESTO_C_COMPILER, "-std=c11", "-Wall", "-Wextra", "-Wpedantic", "-Werror", examples + "/session.c", "-o",
             program},
            {"--cflags", "--libs"});
    end_to_end::Kestod service(sdk_test::internalBuild());
    service.startAndAwait();
    runWith(service, program, "the session's run has ended\n4 messages answered, 0 lost\n");
    EXPECT_THAT(sdk_test::playTimes(service, 2),
                ElementsAre("2.0 s at 0.8 on speaker,headset as S16LE/44100/2, 2 channels, by org.example.session",
                            "4.0 s at 0.8 on speaker,headset as S16LE/44100/2, 2 channels, by org.example.session"));
}

TEST_F(ExamplesTest, TheDriverHelpersInCAndCPlusPlusPublish)
{
    const std::string inC = *directory_ / "driver_c";
    compile(
        {KESTO_C_COMPILER, "-std=c11", "-Wall", "-Wextra", "-Wpedantic", "-Werror", examples + "/driver.c", "-o", inC},
        {"--cflags", "--libs"});
    expectPublishes(inC);
    const std::string inCpp = *directory_ / "driver_cpp";
    compile({KESTO_CXX_COMPILER, "-std=c++17", "-fno-rtti", "-Wall", "-Wextra", "-Wpedantic", "-Wshadow",
             "-Wold-style-cast", "-Wconversion", "-Werror", examples + "/driver.cpp", "-o", inCpp},
            {"--cflags", "--libs"});
    expectPublishes(inCpp);
}

// The examples in a text: in a document the fenced blocks of that language; in a header the indented parts of its
// comments. Each becomes a function, behind common includes.
std::string functionsOf(const std::vector<std::string>& files, const std::string& language, std::size_t& count)
{
    std::string includes;
    std::string functions;
    for (const std::string& file : files) {
        std::ifstream stream(file);
        EXPECT_TRUE(stream) << file;
        const bool isDocument = file.ends_with(".md");
        bool isInside = false;
        for (std::string line; std::getline(stream, line);) {
            constexpr std::string_view indented = "//     ";
            const bool isFence = isDocument && line.starts_with("```");
            const bool isExample = isDocument ? isInside != isFence && (isInside || line == "```" + language)
                                              : line.starts_with(indented) || (isInside && line == "//");
            if (isExample && !isInside)
                functions += "void example" + std::to_string(++count) + "()\n{\n";
            if (!isExample && isInside)
                functions += "}\n";
            isInside = isExample;
            if (!isExample || isFence)
                continue;
            const std::string code = isDocument ? line : line.substr(std::min(line.size(), indented.size()));
            if (code.starts_with("#include"))
                includes += code + '\n';
            else if (code != "...")
                functions += code + '\n';
        }
    }
    return includes + "void mix(uint64_t buffer);\nextern uint64_t buffer, frames;\n" + functions;
}

TEST_F(ExamplesTest, WhatDocumentsAndHeadersShowCompilesAsItStands)
{
    const std::string source = KESTO_SOURCE_DIRECTORY "/";
    const std::string headers = prefix() + "/include/kesto/";
    std::size_t inC = 0;
    const std::string fileInC = *directory_ / "shown.c";
    std::ofstream(fileInC) << "#include <kesto/channels.h>\n#include <kesto/playback.h>\n#include <kesto/trace.h>\n"
                           << functionsOf({source + "docs/libkesto.md", headers + "kesto.h", headers + "channels.h",
                                           headers + "playback.h", headers + "trace.h"},
                                          "c", inC);
    EXPECT_EQ(inC, 6U);
    compile({KESTO_C_COMPILER, "-std=c11", "-fsyntax-only", "-Wall", "-Wextra", "-Wno-unused", "-Werror", fileInC},
            {"--cflags"});

    std::size_t inCpp = 0;
    const std::string fileInCpp = *directory_ / "shown.cpp";
    std::ofstream(fileInCpp) << "#include <kesto/channels.hpp>\n#include <kesto/playback.hpp>\n#include "
                                "<kesto/trace.hpp>\nextern kesto::Client client;\n"
                             << functionsOf({source + "README.md", source + "docs/libkesto.md", headers + "kesto.hpp",
                                             headers + "channels.hpp", headers + "playback.hpp", headers + "trace.hpp"},
                                            "c++", inCpp);
    EXPECT_EQ(inCpp, 9U);
    compile({KESTO_CXX_COMPILER, "-std=c++17", "-fsyntax-only", "-Wall", "-Wextra", "-Werror", fileInCpp},
            {"--cflags"});
}

TEST_F(ExamplesTest, AProjectFindsTheLibraryWithCMake)
{
    const std::string project = *directory_ / "project";
    std::filesystem::create_directory(project);
    std::ofstream(project + "/CMakeLists.txt") << "cmake_minimum_required(VERSION 3.20)\n"
                                                  "project(player LANGUAGES C CXX)\n"
                                                  "find_package(kesto 0.1 REQUIRED)\n"
                                                  "add_executable(player "
                                               << examples
                                               << "/player.cpp)\n"
                                                  "target_compile_features(player PRIVATE cxx_std_20)\n"
                                                  "target_link_libraries(player PRIVATE kesto::kesto)\n"
                                                  "add_executable(static-player "
                                               << examples
                                               << "/player.c)\n"
                                                  "target_link_libraries(static-player PRIVATE kesto::kesto-static)\n";
    const Finished configured =
        run({KESTO_CMAKE, "-S", project, "-B", project + "/build", "-G", "Ninja", "-DCMAKE_PREFIX_PATH=" + prefix(),
             "-DCMAKE_C_COMPILER=" KESTO_C_COMPILER, "-DCMAKE_CXX_COMPILER=" KESTO_CXX_COMPILER,
             "-DCMAKE_C_FLAGS=" + sanitizers, "-DCMAKE_CXX_FLAGS=" + sanitizers});
    ASSERT_EQ(configured.status, 0) << configured.output << configured.errors;
    const Finished built = run({KESTO_CMAKE, "--build", project + "/build"});
    ASSERT_EQ(built.status, 0) << built.output << built.errors;
    expectPlayInCPlusPlus(project + "/build/player");
    expectPlayInC(project + "/build/static-player");
}

TEST_F(ExamplesTest, ThePackageForPythonFindsTheInstalledLibrary)
{
    if (!sanitizers.empty())
        GTEST_SKIP() << "Python itself is not built with a sanitizer";
    const Finished printed =
        run({KESTO_PYTHON, "-B", "-c", "import kesto; print(kesto.version())"}, {},
            {"PYTHONPATH=" + prefix() + "/" + KESTO_PYTHON_DIRECTORY, "LD_LIBRARY_PATH=" + library(), "KESTO_LIBRARY"});
    EXPECT_EQ(printed.errors, "");
    EXPECT_EQ(printed.output, std::string(kesto_version()) + "\n");
}

TEST_F(ExamplesTest, OnlyTheInterfaceIsVisibleFromOutside)
{
    const auto expectOnlyOurNames = [](const Finished& listed) {
        ASSERT_EQ(listed.status, 0) << listed.errors;
        std::istringstream lines(listed.output);
        std::size_t functions = 0;
        for (std::string address, type, name; lines >> address >> type >> name;) {
            if (type == "A") // the version's own name
                continue;
            EXPECT_THAT(name, StartsWith("kesto_"));
            ++functions;
        }
        EXPECT_GT(functions, 30U);
    };
    expectOnlyOurNames(run({"nm", "--defined-only", "-D", library() + "/libkesto.so"}));
    const Finished inArchive = run({"nm", "--defined-only", "-g", library() + "/libkesto.a"});
    const std::size_t firstLine = inArchive.output.find("libkesto.o:\n");
    ASSERT_NE(firstLine, std::string::npos);
    if (sanitizers.empty()) // sanitizers add names of their own
        expectOnlyOurNames({inArchive.status, inArchive.output.substr(firstLine + 12), inArchive.errors});
}

TEST_F(ExamplesTest, NeedsNoLibraryButTheLanguages)
{
    const Finished needed = run({"readelf", "-d", library() + "/libkesto.so"});
    EXPECT_THAT(needed.output, HasSubstr("soname: [libkesto.so.0]"));
    EXPECT_THAT(needed.output, testing::Not(HasSubstr("libfmt")));
}

} // namespace
