// tests/unit/usermgmt/account_records_test.cpp: owning, freeing and wiping of records.
#include "usermgmt/account_records.h"

#include <grp.h>
#include <pwd.h>
#include <shadow.h>

#include <gtest/gtest.h>

#include "tests/unit/usermgmt/account_files.h"
#include "tests/unit/usermgmt/secret_watch.h"
#include "usermgmt/core_file_records.h"
#include "usermgmt/secret.h"

TEST(AccountRecords, FreeAcceptsNullAndHalfBuilt) {
    internal_user_free(nullptr);
    internal_group_free(nullptr);
    internal_user_free(g_new0(internal_user, 1));
    internal_group_free(g_new0(internal_group, 1));
    free_passwd(nullptr);
    free_shadow(nullptr);
    free_group(nullptr);
    free_passwd(g_new0(struct passwd, 1));
    free_shadow(g_new0(struct spwd, 1));
    wipe_free(nullptr);
}

TEST(AccountRecords, UserPasswordIsWipedBeforeItIsFreed) {
    secret_watch watch;
    internal_user *user = new_user({.name = "alice", .password = "$5$salt$secrethash"});
    watch.add(user->password);
    internal_user_free(user);
    EXPECT_EQ(watch.wiped(), 1);
    EXPECT_EQ(watch.readable(), lines());
}

// Every field is another's.
static internal_user *new_whole_user() {
    internal_user *user = new_user({.name = "alice", .password = "$5$salt$secrethash"});
    user->type = 4;
    user->shadowed = TRUE;
    user->gecos = g_strdup("Alice");
    user->home = g_strdup("/home/alice");
    user->shell = g_strdup("/bin/false");
    user->uid = 1001;
    user->gid = 100;
    user->last_change = 1'700'000'000;
    return user;
}

TEST(AccountRecords, CopyOfAUserKeepsEveryField) {
    internal_user *user = new_whole_user();
    g_autoptr(internal_user) copy = internal_user_copy(user);
    internal_user_free(user);
    EXPECT_EQ(copy->type, 4U);
    EXPECT_EQ(copy->shadowed, TRUE);
    EXPECT_STREQ(copy->name, "alice");
    EXPECT_STREQ(copy->password, "$5$salt$secrethash");
    EXPECT_STREQ(copy->gecos, "Alice");
    EXPECT_STREQ(copy->home, "/home/alice");
    EXPECT_STREQ(copy->shell, "/bin/false");
    EXPECT_EQ(copy->uid, 1001U);
    EXPECT_EQ(copy->gid, 100U);
    EXPECT_EQ(copy->last_change, 1'700'000'000);
}

TEST(AccountRecords, CopyOfAnEmptyUserIsEmpty) {
    const internal_user empty = {};
    g_autoptr(internal_user) copy = internal_user_copy(&empty);
    EXPECT_EQ(copy->name, nullptr);
    EXPECT_EQ(copy->password, nullptr);
    EXPECT_EQ(copy->gecos, nullptr);
    EXPECT_EQ(copy->home, nullptr);
    EXPECT_EQ(copy->shell, nullptr);
}

static bool is_in_block(const internal_user *user, const char *text) {
    const char *begin = reinterpret_cast<const char *>(user + 1);
    return text >= begin && text < begin + user->room;
}

// In the block of the record, in one of its own, and absent, one after the other.
TEST(AccountRecords, TextsAreReplacedWhereverTheyStand) {
    internal_user *user = new_whole_user();
    for (char *internal_user::*text :
         {&internal_user::name, &internal_user::gecos, &internal_user::home, &internal_user::shell})
        for (const char *first :
             {"longer than what stood there before", "", "x", static_cast<const char *>(nullptr)}) {
            g_autoptr(internal_user) copy = internal_user_copy(user);
            ASSERT_TRUE(is_in_block(copy, copy->*text));
            for (const char *wanted : {first, "another", static_cast<const char *>(nullptr), "y"}) {
                internal_user_replace_text(copy, text, wanted);
                EXPECT_STREQ(copy->*text, wanted);
            }
            EXPECT_STREQ(copy->password, "$5$salt$secrethash");
        }
    internal_user_free(user);
}

TEST(AccountRecords, PasswordOfACopyIsWipedBeforeItIsFreed) {
    secret_watch watch;
    internal_user *user = new_user({.name = "alice", .password = "$5$salt$secrethash"});
    internal_user *copy = internal_user_copy(user);
    watch.add(user->password);
    watch.add(copy->password);
    internal_user_free(user);
    internal_user_free(copy);
    EXPECT_EQ(watch.wiped(), 2);
    EXPECT_EQ(watch.readable(), lines());
}

TEST(AccountRecords, GroupPasswordIsWipedBeforeItIsFreed) {
    secret_watch watch;
    internal_group *group = new_group({.name = "video", .password = "$5$salt$secrethash"});
    watch.add(group->password);
    internal_group_free(group);
    EXPECT_EQ(watch.wiped(), 1);
    EXPECT_EQ(watch.readable(), lines());
}

// Proof that the watch tells a wiped string from one that was only freed.
TEST(AccountRecords, WatchSeesSecretsThatWereNotWiped) {
    secret_watch watch;
    char *secret = g_strdup("secret");
    watch.add(secret);
    g_free(secret);
    EXPECT_EQ(watch.wiped(), 0);
    EXPECT_EQ(watch.readable(), lines{"secret"});
}

TEST(AccountRecords, SecretStringWipesItselfAtTheEndOfItsScope) {
    secret_watch watch;
    {
        g_auto(secret_string) secret = g_strdup("clear text");
        watch.add(secret);
    }
    EXPECT_EQ(watch.wiped(), 1);
}

TEST(AccountRecords, MemberSetOwnsItsNames) {
    g_autoptr(GHashTable) members = member_set_new();
    const std::string name = "alice";
    (void)g_hash_table_add(members, g_strdup(name.c_str()));
    EXPECT_TRUE(g_hash_table_contains(members, "alice"));
    EXPECT_FALSE(g_hash_table_contains(members, "bob"));
}

TEST(AccountRecords, RecordsWalkAnArrayInOrder) {
    g_autoptr(GPtrArray) array = g_ptr_array_new();
    int walked = 0;
    for ([[maybe_unused]] const int *number : records<const int>(array))
        walked++;
    EXPECT_EQ(walked, 0);

    int numbers[] = {7, 8, 9};
    for (int &number : numbers)
        g_ptr_array_add(array, &number);
    for (const int *number : records<const int>(array))
        EXPECT_EQ(number, &numbers[walked++]);
    EXPECT_EQ(walked, 3);
}

class FetchedRecords : public AccountFiles {
  protected:
    // The first record of a file, through the row that reads it.
    static gpointer first_of(const char *name, const char *line, gpointer (*fetch)(FILE *)) {
        write(name, line);
        FILE *stream = fopen((std::string("etc/") + name).c_str(), "r");
        EXPECT_NE(stream, nullptr);
        gpointer record = fetch(stream);
        EXPECT_EQ(fclose(stream), 0);
        return record;
    }
};

TEST_F(FetchedRecords, PasswdPasswordIsWipedBeforeItIsFreed) {
    secret_watch watch;
    gpointer record = first_of("passwd", "a:$5$secret:0:0:::\n", fetch_passwd);
    ASSERT_NE(record, nullptr);
    watch.add(static_cast<struct passwd *>(record)->pw_passwd);
    free_passwd(record);
    EXPECT_EQ(watch.wiped(), 1);
}

TEST_F(FetchedRecords, ShadowPasswordIsWipedBeforeItIsFreed) {
    secret_watch watch;
    gpointer record = first_of("shadow", "a:$5$secret:1::::::\n", fetch_shadow);
    ASSERT_NE(record, nullptr);
    watch.add(static_cast<struct spwd *>(record)->sp_pwdp);
    free_shadow(record);
    EXPECT_EQ(watch.wiped(), 1);
}

TEST_F(FetchedRecords, GroupPasswordIsWipedBeforeItIsFreed) {
    secret_watch watch;
    gpointer record = first_of("group", "a:$5$secret:1:b\n", fetch_group);
    ASSERT_NE(record, nullptr);
    watch.add(static_cast<struct group *>(record)->gr_passwd);
    free_group(record);
    EXPECT_EQ(watch.wiped(), 1);
}
