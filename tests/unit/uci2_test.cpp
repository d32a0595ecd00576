#include "config/uci2.h"

#include <gtest/gtest.h>

#include <cstring>

#include "support/support.h"

using support::contains;
using support::count_of;

namespace {

constexpr const char* FIREWALL = "config rule 'webdav_wan'\n"
                                 "\toption target 'ACCEPT'\n"
                                 "\toption port '8080'\n"
                                 "\tlist proto 'tcp'\n"
                                 "\tlist proto 'udp'\n"
                                 "\n"
                                 "config zone\n"
                                 "\toption name 'lan'\n"
                                 "\n"
                                 "config zone\n"
                                 "\toption name 'wan'\n"
                                 "\tlist network 'wan'\n"
                                 "\tlist network 'wan6'\n"
                                 "\n"
                                 "config defaults\n"
                                 "\toption input 'REJECT'\n";

class Uci : public testing::Test {
protected:
    Uci()
    {
        support::remove_all("/tmp/.uci");
        support::write_file(file, FIREWALL);
        ctx = uci2_new();
        EXPECT_NE(ctx, nullptr);
    }

    ~Uci() override
    {
        uci2_free(ctx);
        support::remove_all(file);
        support::remove_all("/tmp/.uci");
    }

    std::string got(const char* path, int expected = 0)
    {
        char out[64] = "rubbish";
        EXPECT_EQ(uci2_get(ctx, path, out, sizeof(out)), expected) << path;
        return out;
    }

    // What a program that starts now reads.
    static std::string read_afresh(const char* path)
    {
        uci_context* other = uci2_new();
        char out[64] = "rubbish";
        int ret = uci2_get(other, path, out, sizeof(out));
        uci2_free(other);
        return ret == 0 ? out : "(none)";
    }

    [[nodiscard]] std::string on_disk() const { return support::read_file(file); }

    const std::string file = "/etc/config/firewall";
    uci_context* ctx;
};

}  // namespace

TEST_F(Uci, FreeingNoContextGivesOne)
{
    EXPECT_EQ(uci2_free(nullptr), 1);
    EXPECT_EQ(uci2_free(uci2_new()), 0);
}

TEST_F(Uci, AnOptionReadsAsItsString)
{
    EXPECT_EQ(got("firewall.webdav_wan.target"), "ACCEPT");
    EXPECT_EQ(got("firewall.webdav_wan.port"), "8080");
}

TEST_F(Uci, AListReadsAsItsLastElement)
{
    EXPECT_EQ(got("firewall.webdav_wan.proto"), "udp");
}

TEST_F(Uci, ASectionReadsAsItsType)
{
    EXPECT_EQ(got("firewall.webdav_wan"), "rule");
    EXPECT_EQ(got("firewall.@zone[1]"), "zone");
}

TEST_F(Uci, APackageReadsAsTheEmptyText)
{
    EXPECT_EQ(got("firewall"), "");
}

TEST_F(Uci, SectionsCanBeNamedByTypeAndIndex)
{
    EXPECT_EQ(got("firewall.@zone[0].name"), "lan");
    EXPECT_EQ(got("firewall.@zone[1].name"), "wan");
    EXPECT_EQ(got("firewall.@zone[-1].name"), "wan");
    EXPECT_EQ(got("firewall.@zone[-2].name"), "lan");
    EXPECT_EQ(got("firewall.@rule[0].target"), "ACCEPT");
}

TEST_F(Uci, AnIncompleteLookUpFailsWithNotFound)
{
    for (const char* path :
         {"firewall.webdav_wan.missing", "firewall.missing.target", "firewall.missing",
          "firewall.@zone[2].name", "firewall.@zone[1].no"}) {
        ctx->err = 0;
        EXPECT_EQ(got(path, -1), "") << path;
        EXPECT_EQ(ctx->err, 3) << path;
    }
}

TEST_F(Uci, AMissingPackageOrABadPathFails)
{
    for (const char* path : {"missing.a.b", "", ".", "a b.c", "firewall.@zone[.name"}) {
        EXPECT_EQ(got(path, -1), "") << path;
    }
    char out[8] = "rubbish";
    EXPECT_EQ(uci2_get(ctx, nullptr, out, sizeof(out)), -1);
    EXPECT_STREQ(out, "");
    EXPECT_EQ(uci2_get(nullptr, "firewall.webdav_wan.target", out, sizeof(out)), -1);
}

TEST_F(Uci, TheValueIsCutToItsBuffer)
{
    char out[7] = "######";
    EXPECT_EQ(uci2_get(ctx, "firewall.webdav_wan.target", out, 7), 0);
    EXPECT_STREQ(out, "ACCEPT");
    EXPECT_EQ(uci2_get(ctx, "firewall.webdav_wan.target", out, 6), 0);
    EXPECT_STREQ(out, "ACCEP");
}

TEST_F(Uci, ThePathOfTheCallerIsNotWrittenTo)
{
    char path[] = "firewall.@zone[1].name";
    EXPECT_EQ(got(path), "wan");
    EXPECT_STREQ(path, "firewall.@zone[1].name");
}

TEST_F(Uci, ReadingByIndexAndByName)
{
    char out[64];
    EXPECT_EQ(uci2_get_by_index(ctx, "firewall.@zone", 1, "name", out, sizeof(out)), 0);
    EXPECT_STREQ(out, "wan");
    EXPECT_EQ(uci2_get_by_index(ctx, "firewall.@zone", 0, nullptr, out, sizeof(out)), 0);
    EXPECT_STREQ(out, "zone");
    EXPECT_EQ(uci2_get_by_index(ctx, "firewall.@zone", 2, "name", out, sizeof(out)), -1);
    EXPECT_STREQ(out, "");
    EXPECT_EQ(uci2_get_by_name(ctx, "firewall", "webdav_wan", "target", out, sizeof(out)), 0);
    EXPECT_STREQ(out, "ACCEPT");
    EXPECT_EQ(uci2_get_by_name(ctx, "firewall", "webdav_wan", nullptr, out, sizeof(out)), 0);
    EXPECT_STREQ(out, "rule");
    EXPECT_EQ(uci2_get_by_name(ctx, "firewall", "missing", "target", out, sizeof(out)), -1);
    EXPECT_STREQ(out, "");
}

TEST_F(Uci, AChangeIsSavedAndStandsInTheFileAfterTheCommit)
{
    EXPECT_EQ(uci2_set(ctx, "firewall.webdav_wan.target", "REJECT"), 0);
    EXPECT_EQ(got("firewall.webdav_wan.target"), "REJECT");
    EXPECT_TRUE(contains(on_disk(), "option target 'ACCEPT'"));
    EXPECT_EQ(read_afresh("firewall.webdav_wan.target"), "REJECT");

    EXPECT_EQ(uci2_commit(ctx, "firewall"), 0);
    EXPECT_TRUE(contains(on_disk(), "option target 'REJECT'"));
    EXPECT_FALSE(contains(on_disk(), "ACCEPT"));
    support::remove_all("/tmp/.uci");
    EXPECT_EQ(read_afresh("firewall.webdav_wan.target"), "REJECT");
}

TEST_F(Uci, ANewOptionCanBeSet)
{
    EXPECT_EQ(uci2_set(ctx, "firewall.webdav_wan.enabled", "1"), 0);
    EXPECT_EQ(uci2_commit(ctx, "firewall"), 0);
    EXPECT_TRUE(contains(on_disk(), "option enabled '1'"));
}

TEST_F(Uci, AValueOfAnyLengthCanBeSet)
{
    std::string value(1000, 'v');
    EXPECT_EQ(uci2_set(ctx, "firewall.webdav_wan.target", value.c_str()), 0);
    EXPECT_EQ(uci2_commit(ctx, "firewall"), 0);
    EXPECT_TRUE(contains(on_disk(), value));
}

TEST_F(Uci, SettingByIndexAndByName)
{
    EXPECT_EQ(uci2_set_by_index(ctx, "firewall.@zone", 1, "name", "wan2"), 0);
    EXPECT_EQ(uci2_set_by_name(ctx, "firewall", "webdav_wan", "port", "9090"), 0);
    EXPECT_EQ(uci2_set_by_name(ctx, "firewall", "fresh", nullptr, "rule"), 0);
    EXPECT_EQ(uci2_commit(ctx, "firewall"), 0);
    EXPECT_TRUE(contains(on_disk(), "option name 'wan2'"));
    EXPECT_TRUE(contains(on_disk(), "option port '9090'"));
    EXPECT_TRUE(contains(on_disk(), "config rule 'fresh'"));
}

TEST_F(Uci, WithoutAValueNothingIsSetOrRenamed)
{
    EXPECT_EQ(uci2_set(ctx, "firewall.webdav_wan.target", nullptr), -1);
    EXPECT_EQ(uci2_set_by_index(ctx, "firewall.@zone", 0, "name", nullptr), -1);
    EXPECT_EQ(uci2_set_by_name(ctx, "firewall", "webdav_wan", "port", nullptr), -1);
    EXPECT_EQ(uci2_rename(ctx, "firewall.webdav_wan", nullptr), -1);
    EXPECT_EQ(uci2_set(ctx, "missing.a.b", "x"), -1);
    EXPECT_EQ(uci2_set(ctx, nullptr, "x"), -1);
    EXPECT_EQ(got("firewall.webdav_wan.target"), "ACCEPT");
}

TEST_F(Uci, RenamesSectionsAndOptions)
{
    EXPECT_EQ(uci2_rename(ctx, "firewall.webdav_wan.port", "dest_port"), 0);
    EXPECT_EQ(uci2_rename(ctx, "firewall.webdav_wan", "webdav"), 0);
    EXPECT_EQ(uci2_commit(ctx, "firewall"), 0);
    EXPECT_TRUE(contains(on_disk(), "config rule 'webdav'"));
    EXPECT_TRUE(contains(on_disk(), "option dest_port '8080'"));
    EXPECT_FALSE(contains(on_disk(), "webdav_wan"));
    EXPECT_EQ(uci2_rename(ctx, "firewall.missing", "x"), -1);
}

TEST_F(Uci, DeletesSectionsAndOptions)
{
    EXPECT_EQ(uci2_delete(ctx, "firewall.webdav_wan.port"), 0);
    EXPECT_EQ(uci2_delete(ctx, "firewall.@zone[0]"), 0);
    EXPECT_EQ(uci2_commit(ctx, "firewall"), 0);
    EXPECT_FALSE(contains(on_disk(), "8080"));
    EXPECT_FALSE(contains(on_disk(), "'lan'"));
    EXPECT_EQ(uci2_delete(ctx, "firewall.webdav_wan.port"), -1);
}

TEST_F(Uci, AListElementIsAddedWithoutBeingSaved)
{
    EXPECT_EQ(uci2_add_list(ctx, "firewall.webdav_wan.proto", "sctp"), 0);
    EXPECT_EQ(got("firewall.webdav_wan.proto"), "sctp");
    EXPECT_EQ(read_afresh("firewall.webdav_wan.proto"), "udp");
    EXPECT_EQ(uci2_commit(ctx, "firewall"), 0);
    EXPECT_TRUE(contains(on_disk(), "list proto 'sctp'"));
    EXPECT_EQ(uci2_add_list(ctx, "firewall.webdav_wan.proto", nullptr), -1);
}

TEST_F(Uci, AListElementIsTakenOutWithoutBeingSaved)
{
    EXPECT_EQ(uci2_del_list(ctx, "firewall.webdav_wan.proto", "udp"), 0);
    EXPECT_EQ(got("firewall.webdav_wan.proto"), "tcp");
    EXPECT_EQ(read_afresh("firewall.webdav_wan.proto"), "udp");
    EXPECT_EQ(uci2_commit(ctx, "firewall"), 0);
    EXPECT_FALSE(contains(on_disk(), "udp"));
    EXPECT_EQ(uci2_del_list(ctx, "firewall.webdav_wan.proto", nullptr), -1);
}

TEST_F(Uci, CommittingAMissingPackageGivesOne)
{
    EXPECT_EQ(uci2_commit(ctx, "missing"), 1);
    EXPECT_EQ(uci2_commit(ctx, nullptr), 1);
}

TEST_F(Uci, ANewUnnamedSectionIsCommittedAtOnce)
{
    EXPECT_EQ(uci2_add_section("firewall", "redirect"), 0);
    EXPECT_EQ(count_of(on_disk(), "config redirect\n"), 1);
    EXPECT_EQ(uci2_add_section("firewall", "redirect"), 0);
    EXPECT_EQ(count_of(on_disk(), "config redirect\n"), 2);
    EXPECT_EQ(uci2_add_section("missing", "redirect"), -1);
}

TEST_F(Uci, CountsTheSectionsOfAType)
{
    EXPECT_EQ(uci2_count_type(ctx, "firewall.zone"), 2);
    EXPECT_EQ(uci2_count_type(ctx, "firewall.@zone"), 2);
    EXPECT_EQ(uci2_count_type(ctx, "firewall.@rule"), 1);
    for (const char* text :
         {"firewall.@zon", "firewall.@zones", "firewall", "missing.@zone", "", "."}) {
        EXPECT_EQ(uci2_count_type(ctx, text), 0) << text;
    }
    EXPECT_EQ(uci2_count_type(ctx, nullptr), 0);
}

TEST_F(Uci, ATypeArgumentOf100BytesIsRefused)
{
    // 99 bytes are taken: the type is as long as needed.
    std::string type(99 - strlen("firewall.@"), 't');
    support::write_file(file, "config " + type + "\n\nconfig " + type + "t\n");
    EXPECT_EQ(uci2_count_type(ctx, ("firewall.@" + type).c_str()), 1);
    EXPECT_EQ(uci2_count_type(ctx, ("firewall.@" + type + "t").c_str()), 0);
}

TEST_F(Uci, ASearchArgumentOf100BytesIsRefused)
{
    std::string option(99 - strlen("firewall.@zone."), 'o');
    support::write_file(file, "config zone 'z'\n\toption " + option + " '1'\n\toption " + option +
                                  "o '1'\n");
    const char* name = uci2_find_section(ctx, ("firewall.@zone." + option).c_str(), "1");
    ASSERT_NE(name, nullptr);
    EXPECT_STREQ(name, "z");
    EXPECT_EQ(uci2_find_section(ctx, ("firewall.@zone." + option + "o").c_str(), "1"), nullptr);
}

TEST_F(Uci, GivesTheSectionOfATypeAndIndex)
{
    uci_section* section = uci2_get_section(ctx, "firewall.@zone", 1);
    ASSERT_NE(section, nullptr);
    EXPECT_STREQ(section->type, "zone");
    EXPECT_EQ(section, uci2_get_section(ctx, "firewall.@zone", -1));
    EXPECT_NE(section, uci2_get_section(ctx, "firewall.@zone", 0));
    EXPECT_EQ(uci2_get_section(ctx, "firewall.@zone", 2), nullptr);
    EXPECT_EQ(uci2_get_section(ctx, "missing.@zone", 0), nullptr);
}

TEST_F(Uci, FindsTheFirstSectionWhoseOptionHasTheValue)
{
    const char* name = uci2_find_section(ctx, "firewall.@rule.target", "ACCEPT");
    ASSERT_NE(name, nullptr);
    EXPECT_STREQ(name, "webdav_wan");
    // A list counts by its last element.
    EXPECT_NE(uci2_find_section(ctx, "firewall.@rule.proto", "udp"), nullptr);
    EXPECT_EQ(uci2_find_section(ctx, "firewall.@rule.proto", "tcp"), nullptr);
    EXPECT_NE(uci2_find_section(ctx, "firewall.@zone.name", "wan"), nullptr);

    EXPECT_EQ(uci2_find_section(ctx, "firewall.@rule.target", "REJECT"), nullptr);
    EXPECT_EQ(uci2_find_section(ctx, "firewall.@zone.target", "ACCEPT"), nullptr);
    EXPECT_EQ(uci2_find_section(ctx, "firewall.@rule", "ACCEPT"), nullptr);
    EXPECT_EQ(uci2_find_section(ctx, "missing.@rule.target", "ACCEPT"), nullptr);
    EXPECT_EQ(uci2_find_section(ctx, nullptr, "ACCEPT"), nullptr);
    EXPECT_EQ(uci2_find_section(ctx, "firewall.@rule.target", nullptr), nullptr);
}

TEST_F(Uci, FindsAnElementOfAList)
{
    const char* element = uci2_list_contains(ctx, "firewall.webdav_wan.proto", "tcp");
    ASSERT_NE(element, nullptr);
    EXPECT_STREQ(element, "tcp");
    EXPECT_NE(uci2_list_contains(ctx, "firewall.webdav_wan.proto", "udp"), nullptr);
    EXPECT_EQ(uci2_list_contains(ctx, "firewall.webdav_wan.proto", "tc"), nullptr);
    EXPECT_EQ(uci2_list_contains(ctx, "firewall.webdav_wan.port", "8080"), nullptr);
    EXPECT_EQ(uci2_list_contains(ctx, "firewall.webdav_wan", "tcp"), nullptr);
    EXPECT_EQ(uci2_list_contains(ctx, "firewall.webdav_wan.missing", "tcp"), nullptr);
}

TEST_F(Uci, GivesAListsElementByItsPlace)
{
    char out[64] = "kept";
    EXPECT_EQ(uci2_list_item(ctx, "firewall.webdav_wan.proto", 2, out, sizeof(out)), 0);
    EXPECT_STREQ(out, "kept");
    EXPECT_EQ(uci2_list_item(ctx, "firewall.webdav_wan.proto", -1, out, sizeof(out)), 0);
    EXPECT_STREQ(out, "kept");
    EXPECT_EQ(uci2_list_item(ctx, "firewall.webdav_wan.port", 0, out, sizeof(out)), 0);
    EXPECT_STREQ(out, "kept");
    EXPECT_EQ(uci2_list_item(ctx, "firewall.webdav_wan.proto", 0, out, sizeof(out)), 0);
    EXPECT_STREQ(out, "tcp");
    EXPECT_EQ(uci2_list_item(ctx, "firewall.@zone[1].network", 1, out, sizeof(out)), 0);
    EXPECT_STREQ(out, "wan6");
}

TEST_F(Uci, CountsTheElementsOfAList)
{
    EXPECT_EQ(uci2_list_count(ctx, "firewall.webdav_wan.proto"), 2);
    EXPECT_EQ(uci2_list_count(ctx, "firewall.webdav_wan.port"), 0);
    EXPECT_EQ(uci2_list_count(ctx, "firewall.webdav_wan"), 0);
    EXPECT_EQ(uci2_list_count(ctx, "firewall.webdav_wan.missing"), 0);
}

TEST_F(Uci, NothingIsLogged)
{
    EXPECT_EQ(support::log_of([&] {
                  got("firewall.webdav_wan.missing", -1);
                  uci2_set(ctx, "missing.a.b", "x");
                  uci2_commit(ctx, "missing");
              }),
              "");
}

TEST_F(Uci, ResettingTheTypeListDoesNothing)
{
    uci2_reset_typelist();
    EXPECT_EQ(got("firewall.webdav_wan.target"), "ACCEPT");
    EXPECT_EQ(on_disk(), FIREWALL);
}
