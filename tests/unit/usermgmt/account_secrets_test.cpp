// tests/unit/usermgmt/account_secrets_test.cpp: neither clear text nor hashes that are gone stay in
// memory.
#include <fcntl.h>
#include <malloc.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cstdio>
#include <cstring>
#include <functional>
#include <limits>
#include <string>

#include <gtest/gtest.h>

#include "tests/unit/platform/child.h"
#include "tests/unit/platform/process_memory.h"
#include "tests/unit/platform/scratch_folder.h"
#include "usermgmt/core_file.h"
#include "usermgmt/record_check.h"
#include "usermgmt/usermgmt.h"

static constexpr veiled_literal PASSWORD("Tr0ub4dor-and-3-Staples");
static constexpr veiled_literal OTHER_PASSWORD("correct-Horse-and-Battery");
static constexpr veiled_literal HASH("$5$ZZZZZZZZZZZZ$zudeleVaZfzgzvtsL.HxHI5hndEd6eifjOotGYM6oD5");
static constexpr const char *USER = "camd";
// The allocator overwrites the first 32 bytes of what is freed, where a line begins with the name.
static constexpr const char *LONG_NAME = "a-daemon-with-a-name-that-is-longer-than-that";

// The digest of the user's hash in the shadow file, veiled; "" where it has none. What comes before
// it is overwritten by the allocator when it is freed.
static std::string veiled_hash() {
    static constexpr std::size_t BLOCK = 4096;
    static constexpr std::size_t DIGEST = 43;
    auto *block = static_cast<char *>(
        mmap(nullptr, BLOCK, PROT_READ | PROT_WRITE, MAP_PRIVATE | MAP_ANONYMOUS, -1, 0));
    const int fd = open("etc/shadow", O_RDONLY | O_CLOEXEC);
    std::string digest;
    if (read(fd, block, BLOCK - 1) > 0) {
        const char *line = std::strstr(block, USER);
        const char *end =
            line != nullptr ? std::strchr(line + std::strlen(USER) + 1, ':') : nullptr;
        if (end != nullptr && end - line > static_cast<std::ptrdiff_t>(DIGEST))
            std::transform(end - DIGEST, end, std::back_inserter(digest), veil);
    }
    (void)close(fd);
    (void)munmap(block, BLOCK);
    return digest;
}

// How often the user's hash of now, an older one and the passwords stand in memory.
static std::string count(const char *when, const std::string &old_hash) {
    const std::string hash = veiled_hash();
    const auto copies = [](const std::string &veiled) {
        return veiled.empty() ? std::string("no") : std::to_string(count_copies(veiled));
    };
    const int clear = count_copies(PASSWORD.string()) + count_copies(OTHER_PASSWORD.string());
    return std::string(when) + ": " + copies(hash) + " now, " +
           (old_hash == hash ? "same" : copies(old_hash)) + " old, " + std::to_string(clear) +
           " clear\n";
}

static char *writable(const char *text) {
    return const_cast<char *>(text);
}

// "" or what went wrong.
static std::string outcome(gboolean succeeded, const GError *error) {
    return succeeded ? "" : std::string("[") + (error != nullptr ? error->message : "?") + "]\n";
}

// The entry borrows the clear text, which is wiped when the change is made.
static std::string add(usermgmt_ctx *ctx, const std::string &veiled_password) {
    unveiled clear(veiled_password);
    user_entry entry = {};
    entry.type = USER_TYPE_DYNAMIC_SYSTEM;
    entry.name = writable(USER);
    entry.password = writable(clear.text());
    entry.group = writable("video");
    entry.uid = -1;
    g_autoptr(GError) error = nullptr;
    const gboolean added = usermgmt_add_user(ctx, USER, &entry, &error);
    clear.wipe();
    return outcome(added, error);
}

static std::string modify(usermgmt_ctx *ctx, const std::string &veiled_password,
                          const char *comment = nullptr) {
    unveiled clear(veiled_password);
    user_entry entry = {};
    entry.password = writable(clear.text());
    entry.gecos = writable(comment);
    entry.uid = -1;
    g_autoptr(GError) error = nullptr;
    const gboolean modified = usermgmt_modify_user(ctx, USER, &entry, &error);
    clear.wipe();
    return outcome(modified, error);
}

static std::string query(const usermgmt_ctx *ctx) {
    g_auto(user_entry) entry = {};
    g_autoptr(GError) error = nullptr;
    return outcome(usermgmt_get_user(ctx, USER, &entry, &error), error);
}

static void write_file(const char *path, const char *text) {
    FILE *file = std::fopen(path, "we");
    if (file == nullptr || std::fputs(text, file) < 0 || std::fclose(file) != 0)
        std::abort();
}

using secret_work = std::function<std::string()>;

// Runs the work in a process that never saw a secret before, on files without one.
static std::string from_clean_process(const secret_work &work) {
    const scratch_folder folder;
    return text_from_child([&] {
        // What is freed stays to be looked at.
        (void)mallopt(M_TRIM_THRESHOLD, std::numeric_limits<int>::max());
        if (chdir(folder.path().c_str()) != 0 || mkdir("etc", 0755) != 0)
            std::abort();
        write_file("etc/passwd", "root:x:0:0::/root:/bin/sh\n");
        write_file("etc/shadow", "root:*:19000:0:99999:7:0::\n");
        write_file("etc/group", "root::0:\nvideo::44:\n");
        (void)std::fputs(work().c_str(), stdout);
    });
}

static usermgmt_ctx *opened(guint32 flags = 0) {
    usermgmt_ctx *ctx = usermgmt_open(flags, nullptr);
    if (ctx == nullptr)
        std::abort();
    return ctx;
}

// Without it the others would prove nothing.
TEST(AccountSecrets, CopiesAreFound) {
    EXPECT_EQ(from_clean_process([] {
                  usermgmt_ctx *ctx = opened();
                  std::string said = add(ctx, PASSWORD.string());
                  const std::string hash = veiled_hash();
                  static unveiled clear(OTHER_PASSWORD.string());
                  static user_entry entry = {};
                  said += outcome(usermgmt_get_user(ctx, USER, &entry, nullptr), nullptr);
                  // So long that nothing that follows takes its place.
                  const std::string before(50000, 'x');
                  g_free(g_strconcat(before.c_str(), entry.password, nullptr));
                  said += count("in two records, freed unwiped and clear", hash);
                  (void)usermgmt_close(ctx);
                  return said;
              }),
              "in two records, freed unwiped and clear: 3 now, same old, 1 clear\n");
}

TEST(AccountSecrets, OneHashIsKeptUntilItIsReplacedRemovedOrDeleted) {
    EXPECT_EQ(from_clean_process([] {
                  usermgmt_ctx *ctx = opened();
                  std::string said = add(ctx, PASSWORD.string());
                  std::string old = veiled_hash();
                  said += count("added", old);
                  said += query(ctx);
                  said += count("queried", old);
                  said += modify(ctx, OTHER_PASSWORD.string(), "Camera");
                  said += count("modified", old);
                  old = veiled_hash();
                  said += modify(ctx, PASSWORD.string());
                  said += count("password alone", old);
                  old = veiled_hash();
                  said += modify(ctx, PASSWORD.string());
                  said += count("same password", old);
                  said += outcome(usermgmt_disable_password(ctx, USER, nullptr), nullptr);
                  said += count("disabled", old);
                  said += modify(ctx, OTHER_PASSWORD.string());
                  old = veiled_hash();
                  said += count("enabled", old);
                  said += outcome(usermgmt_delete_user(ctx, USER, nullptr), nullptr);
                  said += count("deleted", old);
                  (void)usermgmt_close(ctx);
                  said += count("closed", old);
                  return said;
              }),
              "added: 1 now, same old, 0 clear\n"
              "queried: 1 now, same old, 0 clear\n"
              "modified: 1 now, 0 old, 0 clear\n"
              "password alone: 1 now, 0 old, 0 clear\n"
              "same password: 1 now, same old, 0 clear\n"
              "disabled: no now, 0 old, 0 clear\n"
              "enabled: 1 now, same old, 0 clear\n"
              "deleted: no now, 0 old, 0 clear\n"
              "closed: no now, 0 old, 0 clear\n");
}

// The files as they were read at open are kept, with their hashes, unless that was asked not to be.
TEST(AccountSecrets, HashesOfTheFilesLeaveWithTheContext) {
    const auto of_open = [](guint32 flags) {
        usermgmt_ctx *ctx = opened();
        std::string said = add(ctx, PASSWORD.string());
        (void)usermgmt_close(ctx);
        const std::string old = veiled_hash();
        said += count("closed", old);
        ctx = opened(flags);
        said += count("opened", old);
        said += modify(ctx, OTHER_PASSWORD.string());
        said += count("modified", old);
        (void)usermgmt_close(ctx);
        said += count("closed", old);
        return said;
    };
    EXPECT_EQ(from_clean_process([&] { return of_open(USERMGMT_OPEN_NO_CACHE); }),
              "closed: 0 now, same old, 0 clear\n"
              "opened: 1 now, same old, 0 clear\n"
              "modified: 1 now, 0 old, 0 clear\n"
              "closed: 0 now, 0 old, 0 clear\n");
    EXPECT_EQ(from_clean_process([&] { return of_open(0); }),
              "closed: 0 now, same old, 0 clear\n"
              "opened: 2 now, same old, 0 clear\n"
              "modified: 1 now, 1 old, 0 clear\n"
              "closed: 0 now, 0 old, 0 clear\n");
}

// A write that fails drops the hash with the record, and a refusal before it drops it as well.
TEST(AccountSecrets, NoneStaysAfterAFailure) {
    EXPECT_EQ(from_clean_process([] {
                  usermgmt_ctx *ctx = opened();
                  std::string said = add(ctx, PASSWORD.string());
                  const std::string old = veiled_hash();
                  said += outcome(usermgmt_delete_user(ctx, USER, nullptr), nullptr);
                  (void)rename("etc/group", "etc/away");
                  said += add(ctx, PASSWORD.string());
                  (void)rename("etc/away", "etc/group");
                  said += count("failed", old);
                  (void)usermgmt_close(ctx);
                  return said;
              }),
              "[Failed to add user 'camd', unable to sync core files, failed to write 1/3 core "
              "file(s) group: could not stat() core file at 'etc/group': No such file or "
              "directory]\n"
              "failed: no now, 0 old, 0 clear\n");
}

// The needle was made before, since every allocation takes the place of something freed.
static int copies_of_hash() {
    static const std::string veiled_hash_text = HASH.string();
    return count_copies(veiled_hash_text);
}

// One by one, since what each of them frees is soon used again.
TEST(AccountSecrets, CheckingWritingAndReadingALineLeaveNoCopy) {
    EXPECT_EQ(from_clean_process([] {
                  const core_file *shadow = &core_file_table[CORE_FILE_ROW_SHADOW];
                  unveiled hash(HASH.string());
                  internal_user user = {};
                  user.name = writable(LONG_NAME);
                  user.password = writable(hash.text());
                  user.shadowed = TRUE;
                  g_autoptr(GPtrArray) users = g_ptr_array_new();
                  g_ptr_array_add(users, &user);
                  core_file_data outgoing = {users, TRUE, FALSE};
                  core_file_data incoming = {};

                  int copies[5] = {copies_of_hash()};
                  (void)check_user_record(&user, 0, nullptr);
                  copies[1] = copies_of_hash();
                  (void)core_file_sync(shadow, &outgoing, nullptr);
                  copies[2] = copies_of_hash();
                  hash.wipe();
                  (void)core_file_read_data(shadow, &incoming, nullptr);
                  copies[3] = copies_of_hash();
                  g_ptr_array_unref(incoming.data);
                  copies[4] = copies_of_hash();
                  std::string said;
                  for (const int number : copies)
                      said += std::to_string(number) + " ";
                  return said;
              }),
              // Of the record before, and after the check and the writing; then of the one read.
              "1 1 1 1 0 ");
}

// The text is written without another copy of the hash, which is veiled.
static void write_line_with_hash(const char *path, const char *before, const std::string &after) {
    unveiled hash(HASH.string());
    FILE *file = std::fopen(path, "we");
    static char buffer[BUFSIZ];
    if (file == nullptr || std::setvbuf(file, buffer, _IOFBF, sizeof buffer) != 0 ||
        std::fprintf(file, "%s:%s:%s", before, hash.text(), after.c_str()) < 0 ||
        std::fclose(file) != 0)
        std::abort();
    explicit_bzero(buffer, sizeof buffer);
    hash.wipe();
}

// A line that the room was too small for at first, and one that is damaged and passed over.
TEST(AccountSecrets, RoomOfALineLeavesNoCopy) {
    EXPECT_EQ(from_clean_process([] {
                  std::string members = "a";
                  for (int i = 0; i < 3000; i++)
                      members += ",m";
                  write_line_with_hash("etc/group", LONG_NAME, "44:" + members + "\n");
                  write_line_with_hash("etc/shadow", LONG_NAME, "damaged::::::\nb:*:1::::::\n");
                  const auto read_row = [](core_file_row row) {
                      core_file_data incoming = {};
                      (void)core_file_read_data(&core_file_table[row], &incoming, nullptr);
                      return incoming.data;
                  };

                  std::string said = std::to_string(copies_of_hash()) + " ";
                  GPtrArray *groups = read_row(CORE_FILE_ROW_GROUP);
                  said += std::to_string(copies_of_hash()) + " ";
                  g_ptr_array_unref(groups);
                  said += std::to_string(copies_of_hash()) + " ";
                  GPtrArray *shadows = read_row(CORE_FILE_ROW_SHADOW);
                  said += std::to_string(copies_of_hash()) + " of " + std::to_string(shadows->len);
                  g_ptr_array_unref(shadows);
                  return said;
              }),
              "0 1 0 0 of 1");
}
