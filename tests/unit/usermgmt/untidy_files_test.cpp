// tests/unit/usermgmt/untidy_files_test.cpp: what each kind of change makes of files that no
// service wrote: every record, changed or not, becomes its line, and a file that needs no change
// stays.
#include <sys/stat.h>

#include <functional>

#include "tests/unit/usermgmt/changed_accounts.h"

struct untidy_change {
    const char *name;
    std::function<std::string(usermgmt_ctx *)> run;
    std::function<void(std::string *passwd, std::string *shadow, std::string *group)> edit;
    bool writes_users;
    bool writes_groups;
};

class UntidyFiles : public ChangedAccounts {
  protected:
    static constexpr mode_t PASSWD_MODE = 0664;
    static constexpr mode_t SHADOW_MODE = 0400;
    static constexpr mode_t GROUP_MODE = 0606;

    // What another tool may have written of the same accounts: comments, ageing, and what is no
    // record.
    static std::string untidy_passwd() { return "# local accounts\n\n" + PASSWD + "torn:x:7\n"; }
    static std::string untidy_shadow() {
        std::string text = SHADOW;
        text = edited(text, ":19000:0:99999:7:0::", ":19000:1:90:14:30:20000:");
        text = edited(text, ":19001:0:99999:7:0::", ":19001::::::");
        text = edited(text, ":19005:0:99999:7:0::", ":19005:0:99999:7:::");
        return text + "gone:*:19000:0:99999:7:::\n";
    }
    static std::string untidy_group() { return GROUP + "torn:x\n# end\n"; }

    void SetUp() override {
        ChangedAccounts::SetUp();
        put_untidy_files();
    }
    void put_untidy_files() {
        ctx_.reset();
        write("passwd", untidy_passwd());
        write("shadow", untidy_shadow());
        write("group", untidy_group());
        EXPECT_EQ(chmod("etc/passwd", PASSWD_MODE), 0);
        EXPECT_EQ(chmod("etc/shadow", SHADOW_MODE), 0);
        EXPECT_EQ(chmod("etc/group", GROUP_MODE), 0);
        reopen();
        (void)take_syslog();
    }
    static mode_t mode_of(const char *path) {
        struct stat st = {};
        EXPECT_EQ(stat(path, &st), 0) << path;
        return st.st_mode & 07777;
    }
    std::vector<untidy_change> changes();
};

std::vector<untidy_change> UntidyFiles::changes() {
    return {
        {"add user",
         [this](usermgmt_ctx *) {
             return add({.type = 3, .name = "svc", .group = "camera", .groups = {{"audio"}}});
         },                                                                                       [](std::string *passwd, std::string *shadow, std::string *group) {
             *passwd += "svc:x:989:995:::/bin/false\n";
             *shadow += "svc:*:0:0:99999:7:0::\n";
             *group = edited(*group, "45:alice,bob", "45:alice,bob,svc");
             *group = edited(*group, "995:camd", "995:camd,svc");
         },                                             true,  true },
        {"modify comment",   [this](usermgmt_ctx *) { return modify("camd", {.gecos = "Eye"}); },
         [](std::string *passwd,                                                                                          std::string *,       std::string *) {
             *passwd = edited(*passwd, ":Camera:", ":Eye:");
         },                                                   true,  false},
        {"modify groups",
         [this](usermgmt_ctx *) { return modify("alice", {.groups = {{"video"}}}); },
         [](std::string *,                                                                                                std::string *,       std::string *group) {
             *group = edited(*group, "45:alice,bob", "45:bob");
         },                                                   false, true },
        {"delete user",      [this](usermgmt_ctx *) { return delete_user("alice"); },
         [](std::string *passwd,                                                                                          std::string *shadow, std::string *group) {
             *passwd = edited(*passwd, "alice:x:1000:100:Alice:/home/alice:/bin/false\n", "");
             *shadow = edited(*shadow,
                              "alice:" + std::string(ALICES_HASH) + ":19005:0:99999:7:0::\n", "");
             *group = edited(*group, "44:alice", "44:");
             *group = edited(*group, "45:alice,bob", "45:bob");
             *group = edited(*group, "100:alice,bob", "100:bob");
         },                                             true,  true },
        {"disable password", [this](usermgmt_ctx *) { return disable("guest"); },
         [](std::string *,                                                                                                std::string *shadow, std::string *) {
             *shadow = edited(*shadow, "$1$saltsalt$cCPENxTVtU4kpnV2ngztX0", "*");
         },                                             true,  false},
        {"add group",        [this](usermgmt_ctx *) { return add_group("sound", {"bob"}); },
         [](std::string *,                                                                                                std::string *,       std::string *group) { *group += "sound::994:bob\n"; },
         false,                                                                                                                                                                                              true },
        {"delete group",     [this](usermgmt_ctx *) { return delete_group("nvr"); },
         [](std::string *,                                                                                                std::string *,       std::string *group) {
             *group = edited(*group, "nvr:x:60005:\n", "");
         },                                                   false, true },
    };
}

TEST_F(UntidyFiles, EveryRecordBecomesItsLineAndTheOtherFilesStay) {
    for (const untidy_change &change : changes()) {
        SCOPED_TRACE(change.name);
        put_untidy_files();
        std::string passwd = change.writes_users ? PASSWD : untidy_passwd();
        std::string shadow = change.writes_users ? SHADOW : untidy_shadow();
        std::string group = change.writes_groups ? GROUP : untidy_group();
        change.edit(&passwd, &shadow, &group);

        EXPECT_EQ(change.run(ctx_.get()), "");
        expect_files(passwd, shadow, group);
        EXPECT_EQ(mode_of("etc/passwd"), PASSWD_MODE);
        EXPECT_EQ(mode_of("etc/shadow"), SHADOW_MODE);
        EXPECT_EQ(mode_of("etc/group"), GROUP_MODE);
    }
}

// By hand, since a password has a salt of its own.
TEST_F(UntidyFiles, NewPasswordMakesEveryShadowLineNew) {
    EXPECT_EQ(modify("bob", {.password = "new"}), "");
    const std::string hash = fresh_hash("bob", "new");
    expect_files(PASSWD,
                 edited(SHADOW, "$5$0123456789ab$WctjxrUYwM56UM6eXD1UUbn9rUhSi7nLdBfHMfG0PTB:19006",
                        hash + ":" + std::to_string(DAY)),
                 untidy_group());
    EXPECT_EQ(mode_of("etc/shadow"), SHADOW_MODE);
}
