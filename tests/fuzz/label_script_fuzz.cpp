// What the router's label script prints, through its reader and through the record that takes its
// word over blkid's.
//
// The input is the script's output; its size chooses the buffer.

#include <sys/stat.h>

#include <algorithm>
#include <cstring>

#include "disk/part_info.h"
#include "fuzz.h"
#include "util/block_dev.h"
#include "util/paths.h"
#include "util/text.h"

namespace {

constexpr char DEV_NAME[] = "sda1";
constexpr char BLKID_LINE[] = "/dev/sda1: LABEL=\"volume\" UUID=\"1-2\" TYPE=\"vfat\"\n";
constexpr size_t SCRIPT_TEXT_MAX = 128;

std::string script_output;

std::string expected_label(size_t size)
{
    const std::string text = c_text(script_output.substr(0, SCRIPT_TEXT_MAX));
    return text.substr(0, text.find_first_of("\t\n\r")).substr(0, size);
}

void check_reader(size_t size)
{
    std::string expected = expected_label(size);
    expected.resize(size);
    exact_buffer out(size);
    const int ret = script_get_label(DEV_NAME, out.data(), size);
    require(ret == 0, "the output is read");
    require(out.all() == expected, "the label is the first line, cut at the buffer, zero-filled");
}

void check_record()
{
    part_info part{};
    text_copy(part.dev_name, DEV_NAME);
    part_info_fill(&part);
    require(is_clean_text(part.label), "the label is terminated");
    const std::string label = expected_label(PART_LABEL_SIZE - 1);
    require(part.label == (label.empty() ? DEV_NAME : label), "the script's word comes first");
}

}  // namespace

void fuzz_begin()
{
    put_file(LABEL_SCRIPT, "#!/bin/sh\n");
    put_file("/dev/sda1", std::string(4096, '\0'));
}

std::string fuzz_answer(const std::string& command)
{
    if (text_has_prefix(command.c_str(), "blkid ")) {
        return BLKID_LINE;
    }
    require(command == std::string(LABEL_SCRIPT) + " " + DEV_NAME,
            "the script gets the name alone");
    return script_output;
}

void fuzz_one(const std::string& input)
{
    script_output = input;
    if (input.size() % 4 == 0) {
        check_record();
    } else {
        check_reader(1 + input.size() % 150);
    }
}
