// tests/unit/client/password_prompt_test.cpp: what held a secret is wiped whole.
#include "client/password_prompt.h"

#include <cstddef>
#include <cstring>
#include <memory>
#include <new>
#include <string_view>

#include <gtest/gtest.h>

namespace {

// A secret behind a NUL byte, as of a list that is refused for it, is gone as well.
TEST(WipedBytes, AreWipedBehindANulByte) {
    static constexpr std::string_view SECRET{"first\0second", 12};
    using secret_bytes = wiped_bytes<SECRET.size()>;
    alignas(secret_bytes) std::byte room[sizeof(secret_bytes)];
    auto *held = new (room) secret_bytes;
    std::memcpy(held->bytes, SECRET.data(), SECRET.size());
    // Or the compiler leaves out the copy, which nothing reads before the object ends.
    asm volatile("" : : "r"(held) : "memory");

    std::destroy_at(held);

    for (const volatile std::byte &left : room)
        EXPECT_EQ(std::to_integer<int>(left), 0);
}

}  // namespace
