// Router configuration by dotted path text ("package.section.option"; "package.@type[index].option"
// works too). Writes go to the context's change store; uci2_commit and uci2_add_section make them
// permanent. Results are 0 for success and -1 for failure unless a line says otherwise; a failed
// read yields an empty text.
//
// A failure is not logged, but a refusal is: of a missing name or type, a path that is built of
// parts and longer than 127 characters, a path with "=", a list without an option, a name that is
// not all letters, digits and "_", a type that could not be read again. Nothing is written then.
//
// The value text of an option is its string, of a list its last element; that of a section is its
// type.
#pragma once

#include <uci.h>

#include <cstddef>

// A context for all calls below, or null; to be released with uci2_free.
uci_context* uci2_new();

// 0, or 1 for a null context.
int uci2_free(uci_context* ctx);

// Copies the value text into out, cut at size - 1.
int uci2_get(uci_context* ctx, const char* path, char* out, size_t size);

// The same for "type[index]" (type may be "package.@type") and for named sections; a null option
// names the section itself.
int uci2_get_by_index(uci_context* ctx, const char* type, int index, const char* option, char* out,
                      size_t size);
int uci2_get_by_name(uci_context* ctx, const char* package, const char* section, const char* option,
                     char* out, size_t size);

// Set the value and save the change.
int uci2_set(uci_context* ctx, const char* path, const char* value);
int uci2_set_by_index(uci_context* ctx, const char* type, int index, const char* option,
                      const char* value);
int uci2_set_by_name(uci_context* ctx, const char* package, const char* section, const char* option,
                     const char* value);

// Rename or delete a section or option and save the change.
int uci2_rename(uci_context* ctx, const char* path, const char* new_name);
int uci2_delete(uci_context* ctx, const char* path);

// Add an element to a list or take it out, without saving.
int uci2_add_list(uci_context* ctx, const char* path, const char* value);
int uci2_del_list(uci_context* ctx, const char* path, const char* value);

// Writes the package's saved changes into its file. 0 or 1.
int uci2_commit(uci_context* ctx, const char* package);

// Adds an unnamed section of that type and commits it.
int uci2_add_section(const char* package, const char* type);

// Number of sections for "package.type" or "package.@type"; 0 on failure.
int uci2_count_type(uci_context* ctx, const char* package_and_type);

// The section "type[index]", owned by ctx; null when there is none.
uci_section* uci2_get_section(uci_context* ctx, const char* type, int index);

// The name of the first section for "package.@type.option" whose option has that value text, owned
// by ctx; null when there is none.
const char* uci2_find_section(uci_context* ctx, const char* path, const char* value);

// The list element equal to value, owned by ctx; null when there is none.
const char* uci2_list_contains(uci_context* ctx, const char* path, const char* value);

// Copies the list element at index (from 0) into out, which stays untouched when the list is
// shorter. Always 0.
int uci2_list_item(uci_context* ctx, const char* path, int index, char* out, size_t size);

// Number of list elements; 0 when it is no list.
int uci2_list_count(uci_context* ctx, const char* path);

// Does nothing. Exported for programs that look for it in the executable.
extern "C" __attribute__((visibility("default"), used)) void uci2_reset_typelist();
