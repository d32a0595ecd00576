#include "util/guard.h"

#include <fcntl.h>
#include <gtest/gtest.h>

#include <cerrno>
#include <cstring>

namespace {

int open_null()
{
    return open("/dev/null", O_RDWR | O_CLOEXEC);
}

bool is_open(int descriptor)
{
    return fcntl(descriptor, F_GETFD) >= 0 || errno != EBADF;
}

int texts_given_back = 0;

void count_text(char* text)
{
    ++texts_given_back;
    free(text);
}

using counted_text = guard<char*, nullptr, count_text>;

TEST(Guard, gives_back_what_it_holds_at_the_end_of_its_scope)
{
    int descriptor = -1;
    {
        const fd_guard file(open_null());
        ASSERT_GE(file, 0);
        descriptor = file;
        EXPECT_TRUE(is_open(descriptor));
    }
    EXPECT_FALSE(is_open(descriptor));
}

TEST(Guard, gives_back_nothing_when_it_holds_nothing)
{
    texts_given_back = 0;
    {
        const counted_text none(nullptr);
        EXPECT_EQ(none, nullptr);
    }
    EXPECT_EQ(texts_given_back, 0);
}

TEST(Guard, what_is_released_stays_open)
{
    int descriptor = -1;
    {
        fd_guard file(open_null());
        descriptor = file.release();
        EXPECT_EQ(file, -1);
    }
    const fd_guard owner(descriptor);
    EXPECT_TRUE(is_open(owner));
}

TEST(Guard, taking_another_thing_gives_back_the_first)
{
    texts_given_back = 0;
    {
        counted_text text(strdup("one"));
        text.reset(strdup("two"));
        EXPECT_EQ(texts_given_back, 1);
        EXPECT_STREQ(text, "two");
    }
    EXPECT_EQ(texts_given_back, 2);
}

TEST(Guard, descriptor_zero_is_something)
{
    const int saved = fcntl(STDIN_FILENO, F_DUPFD_CLOEXEC, 3);
    fd_guard input(STDIN_FILENO);
    input.reset(-1);
    EXPECT_FALSE(is_open(STDIN_FILENO));
    if (saved >= 0) {
        const fd_guard original(saved);
        EXPECT_EQ(dup2(original, STDIN_FILENO), STDIN_FILENO);
    }
}

}  // namespace
