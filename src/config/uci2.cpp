#include "config/uci2.h"

#include <unistd.h>

#include <cstdlib>
#include <cstring>

#include "config/config_path.h"
#include "util/guard.h"
#include "util/text.h"

namespace {

constexpr size_t SPLIT_SIZE = 100;
constexpr char SECTION_DELIMITERS[] = ".@";
constexpr char OPTION_DELIMITERS[] = ".";
using context_guard = guard<uci_context*, nullptr, uci_free_context>;

// The elements of a library list, one after the other; null after the last.
uci_element* first_element(uci_list* list)
{
    return list->next != list ? list_to_element(list->next) : nullptr;
}

uci_element* next_element(uci_list* list, uci_element* element)
{
    return element->list.next != list ? list_to_element(element->list.next) : nullptr;
}

// The last element of a list is its value: each one takes the place of the one before.
const char* option_text(uci_option* option)
{
    if (option->type == UCI_TYPE_STRING) {
        return option->v.string;
    }
    const char* text = "";
    if (option->type == UCI_TYPE_LIST) {
        uci_list* list = &option->v.list;
        for (uci_element* e = first_element(list); e != nullptr; e = next_element(list, e)) {
            text = e->name;
        }
    }
    return text;
}

const char* value_text(const uci_ptr& ptr)
{
    if (ptr.last == nullptr) {
        return "";
    }
    switch (ptr.last->type) {
        case UCI_TYPE_SECTION:
            return ptr.s->type;
        case UCI_TYPE_OPTION:
            return option_text(ptr.o);
        default:
            return "";
    }
}

// Looks the path up and makes the call. A path with a "=" would end there for the library.
bool change(uci_context* ctx, uci_ptr* ptr, const char* path, const path_copy& copy,
            config_call call)
{
    if (path != nullptr && strchr(path, '=') != nullptr) {
        return config_refuse("path not valid", path);
    }
    return config_look_up(ctx, copy, ptr) && config_call_is_sound(call, *ptr, path) &&
           call(ctx, ptr) == UCI_OK;
}

int change_unsaved(uci_context* ctx, const char* path, const char* value, config_call call)
{
    uci_ptr ptr{};
    return change(ctx, &ptr, path, path_copy(path, value), call) ? 0 : -1;
}

int change_and_save(uci_context* ctx, const char* path, const path_copy& copy, config_call call)
{
    uci_ptr ptr{};
    return change(ctx, &ptr, path, copy, call) && uci_save(ctx, ptr.p) == UCI_OK ? 0 : -1;
}

uci_package* look_up_package(uci_context* ctx, const char* name)
{
    const path_copy path(name);
    uci_ptr ptr{};
    return config_look_up(ctx, path, &ptr) ? ptr.p : nullptr;
}

// The list that a path names, null when it names none.
uci_list* look_up_list(uci_context* ctx, const char* path)
{
    const path_copy copy(path);
    uci_ptr ptr{};
    if (!config_look_up_complete(ctx, copy, &ptr) || ptr.o == nullptr) {
        return nullptr;
    }
    return ptr.o->type == UCI_TYPE_LIST ? &ptr.o->v.list : nullptr;
}

int add_section_to(uci_context* ctx, uci_package* package, const char* type)
{
    uci_section* section = nullptr;
    if (uci_add_section(ctx, package, type, &section) != UCI_OK) {
        return -1;
    }
    return uci_commit(ctx, &package, false) == UCI_OK ? 0 : -1;
}

// The package of that name among those the context has loaded.
uci_package* loaded_package(uci_context* ctx, const char* name)
{
    uci_element* element = nullptr;
    return uci_lookup_next(ctx, &element, &ctx->root, name) == UCI_OK ? uci_to_package(element)
                                                                      : nullptr;
}

bool option_has_value(uci_context* ctx, uci_section* section, const char* name, const char* value)
{
    uci_option* option = uci_lookup_option(ctx, section, name);
    return option != nullptr && strcmp(option_text(option), value) == 0;
}

}  // namespace

uci_context* uci2_new()
{
    return uci_alloc_context();
}

int uci2_free(uci_context* ctx)
{
    if (ctx == nullptr) {
        return 1;
    }
    uci_free_context(ctx);
    return 0;
}

int uci2_get(uci_context* ctx, const char* path, char* out, size_t size)
{
    if (out == nullptr) {
        return -1;
    }
    text_copy({out, size}, "");
    const path_copy copy(path);
    uci_ptr ptr{};
    if (!config_look_up_complete(ctx, copy, &ptr)) {
        return -1;
    }
    text_copy({out, size}, value_text(ptr));
    return 0;
}

int uci2_get_by_index(uci_context* ctx, const char* type, int index, const char* option, char* out,
                      size_t size)
{
    config_path path;
    return uci2_get(ctx, config_path_by_index(path, type, index, option) ? path : nullptr, out,
                    size);
}

int uci2_get_by_name(uci_context* ctx, const char* package, const char* section, const char* option,
                     char* out, size_t size)
{
    config_path path;
    return uci2_get(ctx, config_path_by_name(path, package, section, option) ? path : nullptr, out,
                    size);
}

int uci2_set(uci_context* ctx, const char* path, const char* value)
{
    return change_and_save(ctx, path, path_copy(path, value), uci_set);
}

int uci2_set_by_index(uci_context* ctx, const char* type, int index, const char* option,
                      const char* value)
{
    config_path path;
    return config_path_by_index(path, type, index, option) ? uci2_set(ctx, path, value) : -1;
}

int uci2_set_by_name(uci_context* ctx, const char* package, const char* section, const char* option,
                     const char* value)
{
    config_path path;
    return config_path_by_name(path, package, section, option) ? uci2_set(ctx, path, value) : -1;
}

int uci2_rename(uci_context* ctx, const char* path, const char* new_name)
{
    return change_and_save(ctx, path, path_copy(path, new_name), uci_rename);
}

int uci2_delete(uci_context* ctx, const char* path)
{
    return change_and_save(ctx, path, path_copy(path), uci_delete);
}

int uci2_add_list(uci_context* ctx, const char* path, const char* value)
{
    return change_unsaved(ctx, path, value, uci_add_list);
}

int uci2_del_list(uci_context* ctx, const char* path, const char* value)
{
    return change_unsaved(ctx, path, value, uci_del_list);
}

int uci2_commit(uci_context* ctx, const char* package)
{
    const path_copy path(package);
    uci_ptr ptr{};
    const bool done = config_look_up(ctx, path, &ptr) && uci_commit(ctx, &ptr.p, false) == UCI_OK;
    // Routers lose power without notice.
    sync();
    return done ? 0 : 1;
}

int uci2_add_section(const char* package, const char* type)
{
    if (package == nullptr || type == nullptr || !config_type_is_sound(type)) {
        config_refuse("type not valid", package);
        return -1;
    }
    const context_guard ctx(uci_alloc_context());
    uci_package* loaded = nullptr;
    if (ctx == nullptr || uci_load(ctx, package, &loaded) != UCI_OK) {
        return -1;
    }
    const int ret = add_section_to(ctx, loaded_package(ctx, package), type);
    // The commit has read the package anew.
    uci_unload(ctx, loaded_package(ctx, package));
    return ret;
}

int uci2_count_type(uci_context* ctx, const char* package_and_type)
{
    char text[SPLIT_SIZE];
    if (package_and_type == nullptr || strlen(package_and_type) >= sizeof(text)) {
        return 0;
    }
    text_copy(text, package_and_type);
    char* rest = nullptr;
    const char* package_name = strtok_r(text, SECTION_DELIMITERS, &rest);
    const char* type = strtok_r(nullptr, SECTION_DELIMITERS, &rest);
    uci_package* package = type != nullptr ? look_up_package(ctx, package_name) : nullptr;
    if (package == nullptr) {
        return 0;
    }
    int count = 0;
    uci_list* list = &package->sections;
    for (uci_element* e = first_element(list); e != nullptr; e = next_element(list, e)) {
        if (strcmp(uci_to_section(e)->type, type) == 0) {
            ++count;
        }
    }
    return count;
}

uci_section* uci2_get_section(uci_context* ctx, const char* type, int index)
{
    config_path path;
    if (!config_path_by_index(path, type, index, nullptr)) {
        return nullptr;
    }
    const path_copy copy(path);
    uci_ptr ptr{};
    return config_look_up_complete(ctx, copy, &ptr) ? ptr.s : nullptr;
}

const char* uci2_find_section(uci_context* ctx, const char* path, const char* value)
{
    char text[SPLIT_SIZE];
    if (path == nullptr || value == nullptr || strlen(path) >= sizeof(text)) {
        return nullptr;
    }
    text_copy(text, path);
    char* rest = nullptr;
    const char* package_name = strtok_r(text, SECTION_DELIMITERS, &rest);
    const char* type = strtok_r(nullptr, SECTION_DELIMITERS, &rest);
    const char* option = strtok_r(nullptr, OPTION_DELIMITERS, &rest);
    uci_package* package = option != nullptr ? look_up_package(ctx, package_name) : nullptr;
    if (package == nullptr) {
        return nullptr;
    }
    uci_list* list = &package->sections;
    for (uci_element* e = first_element(list); e != nullptr; e = next_element(list, e)) {
        uci_section* section = uci_to_section(e);
        if (strcmp(section->type, type) == 0 && option_has_value(ctx, section, option, value)) {
            return e->name;
        }
    }
    return nullptr;
}

const char* uci2_list_contains(uci_context* ctx, const char* path, const char* value)
{
    uci_list* list = value != nullptr ? look_up_list(ctx, path) : nullptr;
    if (list == nullptr) {
        return nullptr;
    }
    for (uci_element* e = first_element(list); e != nullptr; e = next_element(list, e)) {
        if (strcmp(e->name, value) == 0) {
            return e->name;
        }
    }
    return nullptr;
}

int uci2_list_item(uci_context* ctx, const char* path, int index, char* out, size_t size)
{
    uci_list* list = out != nullptr ? look_up_list(ctx, path) : nullptr;
    if (list == nullptr) {
        return 0;
    }
    int position = 0;
    for (uci_element* e = first_element(list); e != nullptr; e = next_element(list, e)) {
        if (position++ == index) {
            text_copy({out, size}, e->name);
        }
    }
    return 0;
}

int uci2_list_count(uci_context* ctx, const char* path)
{
    uci_list* list = look_up_list(ctx, path);
    if (list == nullptr) {
        return 0;
    }
    int count = 0;
    for (uci_element* e = first_element(list); e != nullptr; e = next_element(list, e)) {
        ++count;
    }
    return count;
}

void uci2_reset_typelist() {}
