#include "config/uci2.h"

#include <gtest/gtest.h>

#include <cstring>
#include <string>

#include "support/capture.h"
#include "support/child.h"
#include "support/files.h"
#include "support/text.h"

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

    // uci2_commit without the wait for every disk of the machine.
    [[nodiscard]] bool commit() const
    {
        uci_ptr ptr{};
        char name[] = "firewall";
        return uci_lookup_ptr(ctx, &ptr, name, true) == UCI_OK &&
               uci_commit(ctx, &ptr.p, false) == UCI_OK;
    }

    [[nodiscard]] std::string on_disk() const { return support::read_file(file); }

    const std::string file = "/etc/config/firewall";
    uci_context* ctx;
};

}  // namespace

TEST_F(Uci, freeing_no_context_gives_one)
{
    EXPECT_EQ(uci2_free(nullptr), 1);
    EXPECT_EQ(uci2_free(uci2_new()), 0);
}

TEST_F(Uci, an_option_reads_as_its_string)
{
    EXPECT_EQ(got("firewall.webdav_wan.target"), "ACCEPT");
    EXPECT_EQ(got("firewall.webdav_wan.port"), "8080");
}

TEST_F(Uci, a_list_reads_as_its_last_element)
{
    EXPECT_EQ(got("firewall.webdav_wan.proto"), "udp");
}

TEST_F(Uci, a_section_reads_as_its_type)
{
    EXPECT_EQ(got("firewall.webdav_wan"), "rule");
    EXPECT_EQ(got("firewall.@zone[1]"), "zone");
}

TEST_F(Uci, a_package_reads_as_the_empty_text)
{
    EXPECT_EQ(got("firewall"), "");
}

TEST_F(Uci, sections_can_be_named_by_type_and_index)
{
    EXPECT_EQ(got("firewall.@zone[0].name"), "lan");
    EXPECT_EQ(got("firewall.@zone[1].name"), "wan");
    EXPECT_EQ(got("firewall.@zone[-1].name"), "wan");
    EXPECT_EQ(got("firewall.@zone[-2].name"), "lan");
    EXPECT_EQ(got("firewall.@rule[0].target"), "ACCEPT");
}

TEST_F(Uci, an_incomplete_look_up_fails_with_not_found)
{
    for (const char* path :
         {"firewall.webdav_wan.missing", "firewall.missing.target", "firewall.missing",
          "firewall.@zone[2].name", "firewall.@zone[1].no"}) {
        ctx->err = 0;
        EXPECT_EQ(got(path, -1), "") << path;
        EXPECT_EQ(ctx->err, 3) << path;
    }
}

TEST_F(Uci, a_missing_package_or_a_bad_path_fails)
{
    for (const char* path : {"missing.a.b", "", ".", "a b.c", "firewall.@zone[.name"}) {
        EXPECT_EQ(got(path, -1), "") << path;
    }
    char out[8] = "rubbish";
    EXPECT_EQ(uci2_get(ctx, nullptr, out, sizeof(out)), -1);
    EXPECT_STREQ(out, "");
    EXPECT_EQ(uci2_get(nullptr, "firewall.webdav_wan.target", out, sizeof(out)), -1);
}

TEST_F(Uci, the_value_is_cut_to_its_buffer)
{
    char out[7] = "######";
    EXPECT_EQ(uci2_get(ctx, "firewall.webdav_wan.target", out, 7), 0);
    EXPECT_STREQ(out, "ACCEPT");
    EXPECT_EQ(uci2_get(ctx, "firewall.webdav_wan.target", out, 6), 0);
    EXPECT_STREQ(out, "ACCEP");
}

TEST_F(Uci, the_path_of_the_caller_is_not_written_to)
{
    char path[] = "firewall.@zone[1].name";
    EXPECT_EQ(got(path), "wan");
    EXPECT_STREQ(path, "firewall.@zone[1].name");
}

TEST_F(Uci, reading_by_index_and_by_name)
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

TEST_F(Uci, a_change_is_saved_and_stands_in_the_file_after_the_commit)
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

TEST_F(Uci, a_new_option_can_be_set)
{
    EXPECT_EQ(uci2_set(ctx, "firewall.webdav_wan.enabled", "1"), 0);
    EXPECT_EQ(uci2_commit(ctx, "firewall"), 0);
    EXPECT_TRUE(contains(on_disk(), "option enabled '1'"));
}

TEST_F(Uci, a_value_of_any_length_can_be_set)
{
    std::string value(1000, 'v');
    EXPECT_EQ(uci2_set(ctx, "firewall.webdav_wan.target", value.c_str()), 0);
    EXPECT_EQ(uci2_commit(ctx, "firewall"), 0);
    EXPECT_TRUE(contains(on_disk(), value));
}

TEST_F(Uci, setting_by_index_and_by_name)
{
    EXPECT_EQ(uci2_set_by_index(ctx, "firewall.@zone", 1, "name", "wan2"), 0);
    EXPECT_EQ(uci2_set_by_name(ctx, "firewall", "webdav_wan", "port", "9090"), 0);
    EXPECT_EQ(uci2_set_by_name(ctx, "firewall", "fresh", nullptr, "rule"), 0);
    EXPECT_EQ(uci2_commit(ctx, "firewall"), 0);
    EXPECT_TRUE(contains(on_disk(), "option name 'wan2'"));
    EXPECT_TRUE(contains(on_disk(), "option port '9090'"));
    EXPECT_TRUE(contains(on_disk(), "config rule 'fresh'"));
}

TEST_F(Uci, without_a_value_nothing_is_set_or_renamed)
{
    EXPECT_EQ(uci2_set(ctx, "firewall.webdav_wan.target", nullptr), -1);
    EXPECT_EQ(uci2_set_by_index(ctx, "firewall.@zone", 0, "name", nullptr), -1);
    EXPECT_EQ(uci2_set_by_name(ctx, "firewall", "webdav_wan", "port", nullptr), -1);
    EXPECT_EQ(uci2_rename(ctx, "firewall.webdav_wan", nullptr), -1);
    EXPECT_EQ(uci2_set(ctx, "missing.a.b", "x"), -1);
    EXPECT_EQ(uci2_set(ctx, nullptr, "x"), -1);
    EXPECT_EQ(got("firewall.webdav_wan.target"), "ACCEPT");
}

TEST_F(Uci, renames_sections_and_options)
{
    EXPECT_EQ(uci2_rename(ctx, "firewall.webdav_wan.port", "dest_port"), 0);
    EXPECT_EQ(uci2_rename(ctx, "firewall.webdav_wan", "webdav"), 0);
    EXPECT_EQ(uci2_commit(ctx, "firewall"), 0);
    EXPECT_TRUE(contains(on_disk(), "config rule 'webdav'"));
    EXPECT_TRUE(contains(on_disk(), "option dest_port '8080'"));
    EXPECT_FALSE(contains(on_disk(), "webdav_wan"));
    EXPECT_EQ(uci2_rename(ctx, "firewall.missing", "x"), -1);
}

TEST_F(Uci, deletes_sections_and_options)
{
    EXPECT_EQ(uci2_delete(ctx, "firewall.webdav_wan.port"), 0);
    EXPECT_EQ(uci2_delete(ctx, "firewall.@zone[0]"), 0);
    EXPECT_EQ(uci2_commit(ctx, "firewall"), 0);
    EXPECT_FALSE(contains(on_disk(), "8080"));
    EXPECT_FALSE(contains(on_disk(), "'lan'"));
    EXPECT_EQ(uci2_delete(ctx, "firewall.webdav_wan.port"), -1);
}

TEST_F(Uci, a_list_element_is_added_without_being_saved)
{
    EXPECT_EQ(uci2_add_list(ctx, "firewall.webdav_wan.proto", "sctp"), 0);
    EXPECT_EQ(got("firewall.webdav_wan.proto"), "sctp");
    EXPECT_EQ(read_afresh("firewall.webdav_wan.proto"), "udp");
    EXPECT_EQ(uci2_commit(ctx, "firewall"), 0);
    EXPECT_TRUE(contains(on_disk(), "list proto 'sctp'"));
    EXPECT_EQ(uci2_add_list(ctx, "firewall.webdav_wan.proto", nullptr), -1);
}

TEST_F(Uci, a_list_element_is_taken_out_without_being_saved)
{
    EXPECT_EQ(uci2_del_list(ctx, "firewall.webdav_wan.proto", "udp"), 0);
    EXPECT_EQ(got("firewall.webdav_wan.proto"), "tcp");
    EXPECT_EQ(read_afresh("firewall.webdav_wan.proto"), "udp");
    EXPECT_EQ(uci2_commit(ctx, "firewall"), 0);
    EXPECT_FALSE(contains(on_disk(), "udp"));
    EXPECT_EQ(uci2_del_list(ctx, "firewall.webdav_wan.proto", nullptr), -1);
}

TEST_F(Uci, committing_a_missing_package_gives_one)
{
    EXPECT_EQ(uci2_commit(ctx, "missing"), 1);
    EXPECT_EQ(uci2_commit(ctx, nullptr), 1);
}

TEST_F(Uci, a_new_unnamed_section_is_committed_at_once)
{
    EXPECT_EQ(uci2_add_section("firewall", "redirect"), 0);
    EXPECT_EQ(count_of(on_disk(), "config redirect\n"), 1);
    EXPECT_EQ(uci2_add_section("firewall", "redirect"), 0);
    EXPECT_EQ(count_of(on_disk(), "config redirect\n"), 2);
    EXPECT_EQ(uci2_add_section("missing", "redirect"), -1);
}

TEST_F(Uci, counts_the_sections_of_a_type)
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

TEST_F(Uci, a_type_argument_of_100_bytes_is_refused)
{
    // 99 bytes are taken: the type is as long as needed.
    std::string type(99 - strlen("firewall.@"), 't');
    support::write_file(file, "config " + type + "\n\nconfig " + type + "t\n");
    EXPECT_EQ(uci2_count_type(ctx, ("firewall.@" + type).c_str()), 1);
    EXPECT_EQ(uci2_count_type(ctx, ("firewall.@" + type + "t").c_str()), 0);
}

TEST_F(Uci, a_search_argument_of_100_bytes_is_refused)
{
    std::string option(99 - strlen("firewall.@zone."), 'o');
    support::write_file(file, "config zone 'z'\n\toption " + option + " '1'\n\toption " + option +
                                  "o '1'\n");
    const char* name = uci2_find_section(ctx, ("firewall.@zone." + option).c_str(), "1");
    ASSERT_NE(name, nullptr);
    EXPECT_STREQ(name, "z");
    EXPECT_EQ(uci2_find_section(ctx, ("firewall.@zone." + option + "o").c_str(), "1"), nullptr);
}

TEST_F(Uci, gives_the_section_of_a_type_and_index)
{
    uci_section* section = uci2_get_section(ctx, "firewall.@zone", 1);
    ASSERT_NE(section, nullptr);
    EXPECT_STREQ(section->type, "zone");
    EXPECT_EQ(section, uci2_get_section(ctx, "firewall.@zone", -1));
    EXPECT_NE(section, uci2_get_section(ctx, "firewall.@zone", 0));
    EXPECT_EQ(uci2_get_section(ctx, "firewall.@zone", 2), nullptr);
    EXPECT_EQ(uci2_get_section(ctx, "missing.@zone", 0), nullptr);
}

TEST_F(Uci, finds_the_first_section_whose_option_has_the_value)
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

TEST_F(Uci, finds_an_element_of_a_list)
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

TEST_F(Uci, gives_a_lists_element_by_its_place)
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

TEST_F(Uci, counts_the_elements_of_a_list)
{
    EXPECT_EQ(uci2_list_count(ctx, "firewall.webdav_wan.proto"), 2);
    EXPECT_EQ(uci2_list_count(ctx, "firewall.webdav_wan.port"), 0);
    EXPECT_EQ(uci2_list_count(ctx, "firewall.webdav_wan"), 0);
    EXPECT_EQ(uci2_list_count(ctx, "firewall.webdav_wan.missing"), 0);
}

// What the library itself would not survive runs in a process of its own.
TEST_F(Uci, a_section_without_package_or_type_is_refused)
{
    const std::string log = support::log_of([&] {
        EXPECT_EQ(support::in_child([] {
                      EXPECT_EQ(uci2_add_section("firewall", nullptr), -1);
                      EXPECT_EQ(uci2_add_section(nullptr, "zone"), -1);
                      EXPECT_EQ(uci2_add_section(nullptr, nullptr), -1);
                      EXPECT_EQ(uci2_add_section("firewall", ""), -1);
                      return 0;
                  }),
                  0);
    });
    EXPECT_EQ(log, "ERROR[config_path.cpp:N]uci type not valid, path = firewall\n"
                   "ERROR[config_path.cpp:N]uci type not valid, path = \n"
                   "ERROR[config_path.cpp:N]uci type not valid, path = \n"
                   "ERROR[config_path.cpp:N]uci type not valid, path = firewall\n");
    EXPECT_EQ(on_disk(), FIREWALL);
}

TEST_F(Uci, a_path_of_127_characters_is_taken_and_a_longer_one_never_cut)
{
    // The longer path, cut, would be the shorter one.
    const std::string option(127 - strlen("firewall.webdav_wan."), 'o');
    const std::string longer = option + "o";
    ASSERT_EQ(uci2_set(ctx, ("firewall.webdav_wan." + option).c_str(), "short"), 0);
    char out[64] = "rubbish";
    EXPECT_EQ(uci2_get_by_name(ctx, "firewall", "webdav_wan", option.c_str(), out, sizeof(out)), 0);
    EXPECT_STREQ(out, "short");
    const std::string log = support::log_of([&] {
        EXPECT_EQ(uci2_get_by_name(ctx, "firewall", "webdav_wan", longer.c_str(), out, sizeof(out)),
                  -1);
        EXPECT_EQ(uci2_set_by_name(ctx, "firewall", "webdav_wan", longer.c_str(), "long"), -1);
    });
    EXPECT_STREQ(out, "");
    EXPECT_EQ(
        count_of(log, "ERROR[config_path.cpp:N]uci path too long, path = firewall.webdav_wan.ooo"),
        2);
    EXPECT_EQ(got(("firewall.webdav_wan." + option).c_str()), "short");

    const std::string by_index(127 - strlen("firewall.@zone[1]."), 'o');
    ASSERT_EQ(uci2_set_by_index(ctx, "firewall.@zone", 1, by_index.c_str(), "short"), 0);
    support::log_of([&] {
        EXPECT_EQ(uci2_set_by_index(ctx, "firewall.@zone", 1, (by_index + "o").c_str(), "x"), -1);
        EXPECT_EQ(uci2_get_by_index(ctx, "firewall.@zone", 1, (by_index + "o").c_str(), out, 64),
                  -1);
    });
    EXPECT_EQ(uci2_get_by_index(ctx, "firewall.@zone", 1, by_index.c_str(), out, sizeof(out)), 0);
    EXPECT_STREQ(out, "short");
}

TEST_F(Uci, a_path_that_is_too_long_names_no_section)
{
    const std::string type = "firewall.@" + std::string(120, 't');
    EXPECT_TRUE(contains(
        support::log_of([&] { EXPECT_EQ(uci2_get_section(ctx, type.c_str(), 0), nullptr); }),
        "uci path too long"));
}

TEST_F(Uci, without_a_type_or_name_there_is_no_path)
{
    char out[8] = "rubbish";
    const std::string log = support::log_of([&] {
        EXPECT_EQ(uci2_get_by_index(ctx, nullptr, 0, "name", out, sizeof(out)), -1);
        EXPECT_EQ(uci2_get_by_name(ctx, nullptr, "webdav_wan", "port", out, sizeof(out)), -1);
        EXPECT_EQ(uci2_set_by_name(ctx, "firewall", nullptr, "port", "1"), -1);
        EXPECT_EQ(uci2_set_by_index(ctx, nullptr, 0, "name", "x"), -1);
        EXPECT_EQ(uci2_get_section(ctx, nullptr, 0), nullptr);
    });
    EXPECT_STREQ(out, "");
    EXPECT_EQ(count_of(log, "ERROR[config_path.cpp:N]uci "), 5) << log;
    EXPECT_EQ(uci2_get(ctx, "firewall.webdav_wan.port", nullptr, 8), -1);
    EXPECT_EQ(uci2_list_item(ctx, "firewall.webdav_wan.proto", 0, nullptr, 8), 0);
}

TEST_F(Uci, a_list_needs_an_option)
{
    for (const char* path : {"firewall.webdav_wan", "firewall.@zone[0]", "firewall"}) {
        const std::string log = support::log_of([&] {
            EXPECT_EQ(support::in_child([&] {
                          EXPECT_EQ(uci2_add_list(ctx, path, "x"), -1);
                          EXPECT_EQ(uci2_del_list(ctx, path, "x"), -1);
                          EXPECT_EQ(got("firewall.webdav_wan.target"), "ACCEPT");
                          EXPECT_EQ(uci2_commit(ctx, "firewall"), 0);
                          return 0;
                      }),
                      0)
                << path;
        });
        EXPECT_EQ(count_of(log, "ERROR[config_path.cpp:N]uci option missing, path = "), 2) << log;
        EXPECT_EQ(read_afresh("firewall.webdav_wan"), "rule");
        EXPECT_EQ(read_afresh("firewall.webdav_wan.port"), "8080");
    }
    EXPECT_EQ(on_disk(), FIREWALL);
}

TEST_F(Uci, whatever_character_a_type_holds_the_file_can_still_be_read)
{
    for (int c = 1; c < 256; ++c) {
        const std::string type = std::string("ty") + static_cast<char>(c) + "pe";
        const std::string before = on_disk();
        const std::string log = support::log_of([&] {
            const int ret = uci2_add_section("firewall", type.c_str());
            EXPECT_TRUE(ret == 0 || on_disk() == before) << c;
            EXPECT_EQ(ret == 0, contains(on_disk(), "config " + type + "\n")) << c;
        });
        EXPECT_EQ(on_disk() == before, contains(log, "uci type not valid")) << c;
        ASSERT_EQ(read_afresh("firewall.webdav_wan.target"), "ACCEPT") << c;
    }
    EXPECT_TRUE(contains(on_disk(), "config ty-pe\n"));
    EXPECT_FALSE(contains(on_disk(), "config ty'pe\n"));
}

TEST_F(Uci, whatever_character_a_type_that_is_set_holds_the_file_can_still_be_read)
{
    for (int c = 1; c < 256; ++c) {
        const std::string type = std::string("ty") + static_cast<char>(c) + "pe";
        support::log_of([&] {
            const bool fresh = uci2_set(ctx, "firewall.fresh", type.c_str()) == 0;
            const bool old = uci2_set(ctx, "firewall.webdav_wan", type.c_str()) == 0;
            EXPECT_EQ(fresh, old) << c;
            EXPECT_TRUE(commit()) << c;
            EXPECT_EQ(read_afresh("firewall.webdav_wan") == type, old) << c;
        });
        ASSERT_EQ(read_afresh("firewall.webdav_wan.target"), "ACCEPT") << c;
    }
}

TEST_F(Uci, whatever_character_a_name_holds_the_file_can_still_be_read)
{
    for (int c = 1; c < 256; ++c) {
        const std::string name = std::string("na") + static_cast<char>(c) + "me";
        support::log_of([&] {
            uci2_set(ctx, ("firewall." + name).c_str(), "rule");
            uci2_set(ctx, ("firewall.webdav_wan." + name).c_str(), "1");
            uci2_add_list(ctx, ("firewall.webdav_wan." + name).c_str(), "2");
            if (uci2_rename(ctx, "firewall.webdav_wan.port", name.c_str()) == 0) {
                EXPECT_EQ(uci2_rename(ctx, ("firewall.webdav_wan." + name).c_str(), "port"), 0);
            }
            if (uci2_rename(ctx, "firewall.webdav_wan", name.c_str()) == 0) {
                EXPECT_EQ(uci2_rename(ctx, ("firewall." + name).c_str(), "webdav_wan"), 0) << c;
            }
            EXPECT_TRUE(commit()) << c;
        });
        ASSERT_EQ(read_afresh("firewall.@zone[0].name"), "lan") << c;
        uci2_free(ctx);
        support::write_file(file, FIREWALL);
        support::remove_all("/tmp/.uci");
        ctx = uci2_new();
    }
}

TEST_F(Uci, whatever_character_a_value_holds_it_is_read_back_or_refused)
{
    for (int c = 1; c < 256; ++c) {
        const std::string value = std::string("va") + static_cast<char>(c) + "lue";
        const int ret = uci2_set(ctx, "firewall.webdav_wan.target", value.c_str());
        EXPECT_EQ(read_afresh("firewall.webdav_wan.target") == value, ret == 0) << c;
        EXPECT_TRUE(commit()) << c;
        EXPECT_EQ(read_afresh("firewall.webdav_wan.target") == value, ret == 0) << c;
        ASSERT_EQ(read_afresh("firewall.webdav_wan.port"), "8080") << c;
    }
}

TEST_F(Uci, a_section_that_is_not_there_is_not_made_under_its_index)
{
    EXPECT_EQ(uci2_set(ctx, "firewall.@zone[7]", "zone"), -1);
    EXPECT_EQ(uci2_set_by_index(ctx, "firewall.@zone", 7, nullptr, "zone"), -1);
    EXPECT_EQ(uci2_commit(ctx, "firewall"), 0);
    EXPECT_EQ(on_disk(), FIREWALL);
}

TEST_F(Uci, an_equals_sign_in_a_path_writes_nothing)
{
    const std::string log = support::log_of([&] {
        EXPECT_EQ(support::in_child([&] {
                      EXPECT_EQ(uci2_set(ctx, "firewall.webdav_wan.target=x", "y"), -1);
                      EXPECT_EQ(uci2_delete(ctx, "firewall.webdav_wan.proto=0"), -1);
                      EXPECT_EQ(uci2_rename(ctx, "firewall.webdav_wan=x", "y"), -1);
                      EXPECT_EQ(uci2_add_list(ctx, "firewall.webdav_wan.proto=x", "y"), -1);
                      EXPECT_EQ(uci2_commit(ctx, "firewall"), 0);
                      return 0;
                  }),
                  0);
    });
    EXPECT_EQ(count_of(log, "uci path not valid, path = firewall.webdav_wan"), 4) << log;
    EXPECT_EQ(on_disk(), FIREWALL);
}

TEST_F(Uci, a_package_is_neither_set_renamed_nor_deleted)
{
    EXPECT_EQ(support::in_child([&] {
                  EXPECT_EQ(uci2_set(ctx, "firewall", "x"), -1);
                  EXPECT_EQ(uci2_delete(ctx, "firewall"), -1);
                  EXPECT_EQ(uci2_rename(ctx, "firewall", "x"), -1);
                  EXPECT_EQ(uci2_commit(ctx, "firewall"), 0);
                  return 0;
              }),
              0);
    EXPECT_EQ(on_disk(), FIREWALL);
}

TEST_F(Uci, a_failed_look_up_is_not_logged)
{
    EXPECT_EQ(support::log_of([&] {
                  got("firewall.webdav_wan.missing", -1);
                  uci2_set(ctx, "missing.a.b", "x");
                  uci2_commit(ctx, "missing");
              }),
              "");
}

TEST_F(Uci, resetting_the_type_list_does_nothing)
{
    uci2_reset_typelist();
    EXPECT_EQ(got("firewall.webdav_wan.target"), "ACCEPT");
    EXPECT_EQ(on_disk(), FIREWALL);
}
