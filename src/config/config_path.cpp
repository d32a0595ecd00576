#include "config/config_path.h"

#include <cstring>

#include "log/log.h"
#include "util/text.h"

namespace {

constexpr char NAME_CHARACTERS[] = "abcdefghijklmnopqrstuvwxyz"
                                   "ABCDEFGHIJKLMNOPQRSTUVWXYZ"
                                   "0123456789_";

bool is_complete(const uci_ptr& ptr)
{
    return (ptr.flags & uci_ptr::UCI_LOOKUP_COMPLETE) != 0;
}

// A path that was cut would name another option.
bool is_whole(const config_path& path)
{
    return strlen(path) < CONFIG_PATH_SIZE || config_refuse("path too long", path);
}

bool is_name(const char* text)
{
    return text[0] != '\0' && text[strspn(text, NAME_CHARACTERS)] == '\0';
}

}  // namespace

bool config_refuse(const char* reason, const char* path)
{
    log_err("uci %s, path = %s\n", reason, path != nullptr ? path : "");
    return false;
}

bool config_path_by_index(config_path& out, const char* type, int index, const char* option)
{
    if (type == nullptr) {
        return config_refuse("type missing", option);
    }
    if (option != nullptr) {
        text_format(out, "%s[%d].%s", type, index, option);
    } else {
        text_format(out, "%s[%d]", type, index);
    }
    return is_whole(out);
}

bool config_path_by_name(config_path& out, const char* package, const char* section,
                         const char* option)
{
    if (package == nullptr || section == nullptr) {
        return config_refuse("name missing", option);
    }
    if (option != nullptr) {
        text_format(out, "%s.%s.%s", package, section, option);
    } else {
        text_format(out, "%s.%s", package, section);
    }
    return is_whole(out);
}

path_copy::path_copy(const char* path) : text(path != nullptr ? strdup(path) : nullptr) {}

path_copy::path_copy(const char* path, const char* value)
    : text(path != nullptr && value != nullptr ? text_join(path, "=", value) : nullptr)
{
}

bool config_look_up(uci_context* ctx, const path_copy& path, uci_ptr* ptr)
{
    if (ctx == nullptr || path.text == nullptr) {
        return false;
    }
    memset(ptr, 0, sizeof(*ptr));
    return uci_lookup_ptr(ctx, ptr, path.text, true) == UCI_OK;
}

bool config_look_up_complete(uci_context* ctx, const path_copy& path, uci_ptr* ptr)
{
    if (!config_look_up(ctx, path, ptr)) {
        return false;
    }
    if (!is_complete(*ptr)) {
        ctx->err = UCI_ERR_NOTFOUND;
        return false;
    }
    return true;
}

bool config_type_is_sound(const char* type)
{
    // The library takes more for a type, and writes it without quotes.
    for (const char* c = type; *c != '\0'; ++c) {
        if (*c <= ' ' || *c > '~' || strchr("'\"\\#;", *c) != nullptr) {
            return false;
        }
    }
    return type[0] != '\0';
}

bool config_call_is_sound(config_call call, const uci_ptr& ptr, const char* path)
{
    if (call == uci_rename) {
        return is_name(ptr.value) || config_refuse("name not valid", path);
    }
    if ((call == uci_add_list || call == uci_del_list) && ptr.option == nullptr) {
        return config_refuse("option missing", path);
    }
    if (call != uci_set || ptr.option != nullptr || ptr.section == nullptr) {
        return true;
    }
    // A section is set: its value is its type, and one that is not there yet gets its name from the
    // path. An empty value deletes.
    if (ptr.value[0] != '\0' && !config_type_is_sound(ptr.value)) {
        return config_refuse("type not valid", path);
    }
    return ptr.s != nullptr || is_name(ptr.section) || config_refuse("name not valid", path);
}
