#include "util/blkid.h"

#include <cstring>

#include "util/text.h"

blkid_value blkid_find(const char* line, const char* key, const char* ends)
{
    const char* match = strstr(line, key);
    if (match == nullptr) {
        return {};
    }
    const char* quote = match + strlen(key);
    const char* text = *quote != '\0' ? quote + 1 : quote;
    return {text, strcspn(text, ends)};
}

bool blkid_knows(const char* line, const char* dev_path)
{
    return text_has_prefix(line, dev_path);
}
