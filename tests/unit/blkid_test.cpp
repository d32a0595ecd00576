#include "util/blkid.h"

#include <gtest/gtest.h>

#include <string>

namespace {

std::string found(const char* line, const char* key, const char* ends = BLKID_WORD_ENDS)
{
    const blkid_value value = blkid_find(line, key, ends);
    return value.text != nullptr ? std::string(value.text, value.length) : "nothing";
}

}  // namespace

TEST(BlkidFind, takes_the_value_of_the_first_key)
{
    EXPECT_EQ(found("/dev/sda1: LABEL=\"L\" UUID=\"1\" UUID=\"2\"", "UUID="), "1");
    EXPECT_EQ(found("/dev/sda1: PARTUUID=\"p\" UUID=\"1\"", "UUID="), "p");
    EXPECT_EQ(found("/dev/sda1: LABEL=\"\" UUID=\"1\"", "LABEL="), "");
    EXPECT_EQ(found("UUID=\"1\"", "PARTUUID="), "nothing");
    EXPECT_EQ(found("UUID", "UUID="), "nothing");
    EXPECT_EQ(found("", "UUID="), "nothing");
}

TEST(BlkidFind, ends_a_type_at_its_quote_and_a_word_also_at_a_space)
{
    EXPECT_EQ(found("LABEL=\"My Disk\" TYPE=\"a b\"", "LABEL="), "My");
    EXPECT_EQ(found("LABEL=\"My Disk\" TYPE=\"a b\"", "TYPE=", BLKID_QUOTE), "a b");
}

TEST(BlkidFind, of_cut_output_takes_what_is_there)
{
    EXPECT_EQ(found("UUID=\"12", "UUID="), "12");
    EXPECT_EQ(found("UUID=\"", "UUID="), "");
    EXPECT_EQ(found("UUID=", "UUID="), "");
}

TEST(BlkidKnows, the_device_whose_path_begins_the_line)
{
    EXPECT_TRUE(blkid_knows("/dev/sda1: UUID=\"1\"\n", "/dev/sda1"));
    EXPECT_FALSE(blkid_knows("/dev/sdb1: UUID=\"1\"\n", "/dev/sda1"));
    EXPECT_FALSE(blkid_knows(" /dev/sda1: UUID=\"1\"\n", "/dev/sda1"));
    EXPECT_FALSE(blkid_knows("/dev/sda", "/dev/sda1"));
    EXPECT_FALSE(blkid_knows("", "/dev/sda1"));
}
