// SPDX-License-Identifier: Apache-2.0
// The credentials file: what it may say, and who may read it.
#include "kesto-uplink/transport/Credentials.h"
#include "support/TemporaryDirectory.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace {

using kesto_uplink::Credentials;
using kesto_uplink::CredentialsError;
using kesto_uplink::readCredentials;
using testing::HasSubstr;
namespace fs = std::filesystem;

class CredentialsFile : public testing::Test {
protected:
    Credentials read(const std::string& text)
    {
        support::writeFile(file, text);
        fs::permissions(file, fs::perms(0640));
        return readCredentials(file);
    }
    std::string problem(const std::string& text)
    {
        try {
            read(text);
        } catch (const CredentialsError& error) {
            return error.what();
        }
        return "none";
    }

    support::TemporaryDirectory directory;
    fs::path file = directory / "credentials.toml";
};

TEST_F(CredentialsFile, aNameHasAPassword)
{
    const Credentials read = this->read("name = \"lounge-1_a\"\npassword = \"p w\"\n");
    EXPECT_EQ(read.name, "lounge-1_a");
    EXPECT_EQ(read.password, "p w");
    EXPECT_FALSE(read.isPlain);
    EXPECT_TRUE(this->read("name = \"a\"\npassword = \"p\"\nplain = true\n").isPlain);
}

TEST_F(CredentialsFile, aNameHasAKeyInstead)
{
    const Credentials read = this->read("name = \"a\"\nkey = \"UA\"\nseed = \"SUA\"\n");
    EXPECT_EQ(read.publicKey, "UA");
    EXPECT_EQ(read.seed, "SUA");
}

TEST_F(CredentialsFile, mistakesAreNamed)
{
    EXPECT_THAT(problem("password = \"p\""), HasSubstr("needs a name"));
    EXPECT_THAT(problem("name = \"a.b\"\npassword = \"p\""), HasSubstr("letters, digits"));
    EXPECT_THAT(problem("name = \"a\""), HasSubstr("password"));
    EXPECT_THAT(problem("name = \"a\"\nkey = \"UA\""), HasSubstr("seed"));
    EXPECT_THAT(problem("name = \"a\"\npassword = \"p\"\nkey = \"UA\"\nseed = \"SUA\""), HasSubstr("either"));
    EXPECT_THAT(problem("name = \"a\"\npasword = \"p\""), HasSubstr("unknown key pasword"));
    EXPECT_THAT(problem("name = 5"), HasSubstr("name that is not text"));
    EXPECT_THAT(problem("name = \"a\"\npassword = \"p\"\nplain = \"yes\""), HasSubstr("true or false"));
    EXPECT_THAT(problem("name = \"a\"\npassword"), HasSubstr("no TOML in line 2"));
    EXPECT_THAT(problem("name = \"a\"\npassword = \"p\""), HasSubstr("none"));
}

TEST_F(CredentialsFile, aFileThatOthersMayReadIsRefused)
{
    read("name = \"a\"\npassword = \"p\"");
    fs::permissions(file, fs::perms(0644));
    try {
        static_cast<void>(readCredentials(file));
        FAIL();
    } catch (const CredentialsError& error) {
        EXPECT_THAT(error.what(), HasSubstr("chmod o= " + file.native()));
    }
}

TEST_F(CredentialsFile, aMissingFileAndAFolderAreNamed)
{
    EXPECT_THROW(static_cast<void>(readCredentials(directory / "none")), CredentialsError);
    EXPECT_THROW(static_cast<void>(readCredentials(directory.path())), CredentialsError);
}

} // namespace
