// tests/unit/platform/digest_secrets_test.cpp: neither passwords nor their sums stay in memory.
#include <algorithm>
#include <cstdio>
#include <string>

#include <gtest/gtest.h>

#include "platform/digest_entry/digest_file.h"
#include "tests/unit/platform/child.h"
#include "tests/unit/platform/process_memory.h"
#include "tests/unit/platform/scratch_folder.h"

static constexpr veiled_literal PASSWORD("Tr0ub4dor-and-3-Staples");
static constexpr veiled_literal HASH("d3ef676f7560703ca411b3bfd32a30d9");
static constexpr veiled_literal HASH_BYTES(
    "\323\357\147\157\165\140\160\074\244\021\263\277\323\052\060\331");

// The lines of a list, as veiled as the sum in them.
static std::string veiled_line() {
    std::string line = "alice:PRIVANE:";

    std::transform(line.begin(), line.end(), line.begin(), veil);
    return line + HASH.string() + veil('\n');
}

static std::string copies_left() {
    return std::to_string(count_copies(PASSWORD.string())) + " passwords, " +
           std::to_string(count_copies(HASH.string())) + " sums, " +
           std::to_string(count_copies(HASH_BYTES.string())) + " binary sums";
}

// Runs the work in a process that never saw a secret before.
static std::string copies_after(void (*work)(const char *path)) {
    const scratch_folder folder;

    folder.write("digest", "");
    return text_from_child([&] {
        work(folder.path("digest").c_str());
        (void)std::fputs(copies_left().c_str(), stdout);
    });
}

static constexpr const char *NONE = "0 passwords, 0 sums, 0 binary sums";

// Without it the others would prove nothing.
TEST(DigestSecrets, CopiesAreFound) {
    EXPECT_EQ(copies_after([](const char *) {
                  static unveiled password(PASSWORD.string());
                  static unveiled hash(HASH.string());
                  static unveiled bytes(HASH_BYTES.string());
              }),
              "1 passwords, 1 sums, 1 binary sums");
    EXPECT_EQ(copies_after([](const char *) {
                  unveiled password(PASSWORD.string());
                  static std::string copies = std::string(70000, 'x') + password.text() +
                                              std::string(50000, 'x') + password.text();
                  password.wipe();
              }),
              "2 passwords, 0 sums, 0 binary sums");
    EXPECT_EQ(copies_after([](const char *) {}), NONE);
}

TEST(DigestSecrets, NoneStaysAfterSet) {
    EXPECT_EQ(copies_after([](const char *path) {
                  unveiled password(PASSWORD.string());
                  if (digest_file_set(path, "alice", password.text()) != 0)
                      (void)std::fputs("failed to add, ", stdout);
                  if (digest_file_set(path, "bob", "x") != 0)
                      (void)std::fputs("failed to read, ", stdout);
                  password.wipe();
              }),
              NONE);
}

TEST(DigestSecrets, NoneStaysAfterSetList) {
    EXPECT_EQ(copies_after([](const char *path) {
                  unveiled list(veiled_line());
                  if (digest_file_set_list(path, list.text()) != 0)
                      (void)std::fputs("failed to add, ", stdout);
                  if (digest_file_delete(path, "bob") != 0)
                      (void)std::fputs("failed to read, ", stdout);
                  list.wipe();
              }),
              NONE);
}

TEST(DigestSecrets, NoneStaysAfterAFailure) {
    EXPECT_EQ(copies_after([](const char *) {
                  unveiled password(PASSWORD.string());
                  unveiled list(veiled_line() + veil('\n'));
                  if (digest_file_set("/nonexistent/x", "alice", password.text()) == 0 ||
                      digest_file_set_list("/nonexistent/x", list.text()) == 0)
                      (void)std::fputs("no failure, ", stdout);
                  password.wipe();
                  list.wipe();
              }),
              NONE);
}
