#include "util/scratch.h"

#include "log/log.h"
#include "util/command.h"
#include "util/exec.h"
#include "util/file.h"
#include "util/text.h"

namespace {

// True when the file may be read.
bool has_run(const scratch_query& query, const char* format, scratch_words words, const char* file,
             int line)
{
    char command[COMMAND_SIZE];
    if (!command_format(command, format, words)) {
        log_warn("command err, cmd = %s\n", format);
        return false;
    }
    if (query.starts_clear) {
        file_delete(query.path);
    }
    const int ret = exec_cmd_into(command, query.path, file, line);
    return ret == 0 || (ret > 0 && !query.wants_end);
}

void end_query(const scratch_query& query, bool was_read)
{
    const bool deleted =
        query.end == SCRATCH_DELETED || (query.end == SCRATCH_DELETED_WHEN_READ && was_read);
    if (deleted) {
        file_delete(query.path);
    }
}

}  // namespace

scratch_text::scratch_text(const scratch_query& asked, const char* format, scratch_words words,
                           const char* file, int line)
    : query(asked), ran(has_run(asked, format, words, file, line)),
      text(ran ? file_read_all(asked.path) : nullptr)
{
}

scratch_text::~scratch_text()
{
    if (ran) {
        end_query(query, text != nullptr);
    }
}

scratch_lines::scratch_lines(const scratch_query& asked, const char* format, scratch_words words,
                             const char* file, int line)
    : query(asked), ran(has_run(asked, format, words, file, line)),
      stream(ran ? fopen(asked.path, "re") : nullptr)
{
}

scratch_lines::~scratch_lines()
{
    if (ran) {
        end_query(query, stream != nullptr);
    }
}

bool scratch_read(const scratch_query& query, std::span<char> out, const char* format,
                  scratch_words words, const char* file, int line)
{
    text_clear(out);
    if (!has_run(query, format, words, file, line)) {
        return false;
    }
    const bool was_read = file_read_text(query.path, out) == 0;
    end_query(query, was_read);
    return was_read;
}
