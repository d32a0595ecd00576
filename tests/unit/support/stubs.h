// Programs that stand in for the system's and write down how they are called.
#pragma once

#include <string>
#include <vector>

namespace support {

// Programs in front of PATH. One object at a time; all its programs go away with it.
class stub_programs {
public:
    stub_programs();
    ~stub_programs();

    stub_programs(const stub_programs&) = delete;
    stub_programs& operator=(const stub_programs&) = delete;

    // A program found by name. body is shell text that runs after the call was written down.
    void add(const std::string& name, const std::string& body = "exit 0");

    // The same at a fixed path, for example "/etc/init.d/firewall".
    void add_at(const std::string& path, const std::string& body = "exit 0");

    // Every call so far in order, as "name argument argument"; arguments stand in it unquoted.
    [[nodiscard]] std::vector<std::string> calls() const;

    void forget_calls();

private:
    std::string old_path;
    std::vector<std::string> placed;
};

}  // namespace support
