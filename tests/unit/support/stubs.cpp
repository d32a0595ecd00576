#include "support/stubs.h"

#include <cstdlib>

#include "support/files.h"
#include "support/text.h"

namespace support {

namespace {

constexpr const char* STUB_DIR = "/run/stubs";
constexpr const char* CALL_LOG = "/run/stub_calls";

std::string record_line(const std::string& name)
{
    return "printf '%s\\n' \"" + name + "${*:+ }$*\" >>" + CALL_LOG + "\n";
}

}  // namespace

stub_programs::stub_programs()
{
    remove_all(STUB_DIR);
    make_dir(STUB_DIR);
    const char* path = getenv("PATH");
    old_path = path != nullptr ? path : "";
    setenv("PATH", (std::string(STUB_DIR) + ":" + old_path).c_str(), 1);
}

stub_programs::~stub_programs()
{
    for (const std::string& path : placed) {
        remove_all(path);
    }
    setenv("PATH", old_path.c_str(), 1);
    remove_all(STUB_DIR);
    remove_all(CALL_LOG);
}

void stub_programs::add(const std::string& name, const std::string& body)
{
    write_script(std::string(STUB_DIR) + "/" + name, record_line(name) + body);
}

void stub_programs::add_at(const std::string& path, const std::string& body)
{
    write_script(path, record_line(path) + body);
    placed.push_back(path);
}

std::vector<std::string> stub_programs::calls() const
{
    return lines_of(read_file(CALL_LOG));
}

void stub_programs::forget_calls()
{
    remove_all(CALL_LOG);
}

}  // namespace support
