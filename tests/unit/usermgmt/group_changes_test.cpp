// tests/unit/usermgmt/group_changes_test.cpp: adding and deleting groups, and the refusal to modify
// one.
#include <utility>

#include "tests/unit/usermgmt/changed_accounts.h"

class GroupAdd : public ChangedAccounts {};

TEST_F(GroupAdd, MissingArguments) {
    usermgmt_ctx closed = {};
    error_slot error;
    for (usermgmt_ctx *ctx : {static_cast<usermgmt_ctx *>(nullptr), &closed}) {
        EXPECT_FALSE(usermgmt_add_group(ctx, nullptr, nullptr, error.out()));
        EXPECT_EQ(error.text(),
                  "usermgmt 17: Failed to add group: Invalid or uninitialised context");
    }
    EXPECT_FALSE(usermgmt_add_group(ctx_.get(), nullptr, nullptr, error.out()));
    EXPECT_EQ(error.text(),
              "usermgmt 17: Failed to add group: Invalid or missing 'groupname' argument");
    expect_nothing_changed();
}

TEST_F(GroupAdd, Names) {
    static constexpr const char *CHARACTERS = "group name contains invalid characters";
    struct name_case {
        const char *name;
        int code;
        const char *reason;
    };
    static const std::string LONG_NAME(500, 'n');
    const name_case cases[] = {
        {"sound",           0, ""                                           },
        {"web_admins",      0, ""                                           },
        {"a.b-c",           0, ""                                           },
        {"host$",           0, ""                                           },
        {"$",               0, ""                                           },
        {"a@b",             0, ""                                           },
        {"_",               0, ""                                           },
        {".",               0, ""                                           },
        {"@",               0, ""                                           },
        {"a-",              0, ""                                           },
        {"AZaz09",          0, ""                                           },
        {"7",               0, ""                                           },
        {LONG_NAME.c_str(), 0, ""                                           },
        {"video",           7, "group already exists"                       },
        {"root",            7, "group already exists"                       },
        {"Video",           0, ""                                           },
        {"",                4, "group name must have at least one character"},
        {"-x",              4, "group name cannot begin with '-'"           },
        {"-",               4, "group name cannot begin with '-'"           },
        {"-x y",            4, "group name cannot begin with '-'"           },
        {"$host",           4, CHARACTERS                                   },
        {"ho$st",           4, CHARACTERS                                   },
        {"host$$",          4, CHARACTERS                                   },
        {"a b",             4, CHARACTERS                                   },
        {" a",              4, CHARACTERS                                   },
        {"a ",              4, CHARACTERS                                   },
        {"a:b",             4, CHARACTERS                                   },
        {"a,b",             4, CHARACTERS                                   },
        {"a\nb",            4, CHARACTERS                                   },
        {"+a",              4, CHARACTERS                                   },
        {"#a",              4, CHARACTERS                                   },
        {"a/b",             4, CHARACTERS                                   },
        {"a[b",             4, CHARACTERS                                   },
        {"a`b",             4, CHARACTERS                                   },
        {"a{b",             4, CHARACTERS                                   },
        {"\xc3\xa4",        4, CHARACTERS                                   },
        {"a\xff",           4, CHARACTERS                                   },
    };
    for (const name_case &row : cases) {
        remember();
        if (row.code == 0) {
            EXPECT_EQ(add_group(row.name), "");
            expect_memory_on_disk();
            EXPECT_TRUE(usermgmt_group_exists(ctx_.get(), row.name)) << row.name;
            continue;
        }
        EXPECT_EQ(add_group(row.name), "usermgmt " + std::to_string(row.code) +
                                           ": Failed to add group '" + row.name + "', " +
                                           row.reason);
        expect_nothing_changed();
    }
}

TEST_F(GroupAdd, FileAndRecord) {
    EXPECT_EQ(add_group("sound", {"bob"}), "");
    expect_files(PASSWD, SHADOW, GROUP + "sound::994:bob\n");
    EXPECT_EQ(replaced(), lines{"group"});
    EXPECT_EQ(group("sound")->type, GROUP_TYPE_DYNAMIC_SYSTEM);
    EXPECT_EQ(group("sound")->password, nullptr);

    EXPECT_EQ(add_group("light", {"root", "alice", "root", "nobody"}), "");
    EXPECT_EQ(add_group("none"), "");
    expect_files(PASSWD, SHADOW,
                 GROUP + "sound::994:bob\nlight::993:alice,nobody,root\nnone::992:\n");
    expect_memory_on_disk();
}

TEST_F(GroupAdd, MemberListMayBeAbsent) {
    EXPECT_TRUE(usermgmt_add_group(ctx_.get(), "sound", nullptr, nullptr));
    EXPECT_EQ(read("group"), with_members_sorted(read("group")));
    EXPECT_EQ(with_members_sorted(read("group")), GROUP + "sound::994:\n");
}

TEST_F(GroupAdd, GidsGoOnBelowTheLowest) {
    struct gid_case {
        const char *lines;
        const char *gid;
    };
    static constexpr gid_case cases[] = {
        {"",                       "999"},
        {"a:x:995:\n",             "994"},
        {"a:x:999:\nb:x:501:\n",   "500"},
        {"a:x:60001:\nb:x:499:\n", "999"},
    };
    const std::string users = "root:x:0:\nusers:x:100:\nnogroup:x:65534:\n";
    write("passwd", "root:x:0:0:root:/root:/bin/sh\n");
    write("shadow", "root:*:19000:0:99999:7:0::\n");
    for (const gid_case &row : cases) {
        write("group", users + row.lines);
        reopen();
        EXPECT_EQ(add_group("new"), "");
        EXPECT_EQ(read("group"), users + row.lines + "new::" + row.gid + ":\n");
    }
    write("group", users + "a:x:500:\n");
    reopen();
    EXPECT_EQ(add_group("new"),
              "usermgmt 14: Failed to add group 'new', No more available GIDs in the dynamic "
              "system range (500 - 999)");
    expect_nothing_changed();
}

TEST_F(GroupAdd, GidOfADeletedGroupIsNotReused) {
    EXPECT_EQ(add_group("one"), "");
    EXPECT_EQ(add_group("two"), "");
    EXPECT_EQ(delete_group("one"), "");
    EXPECT_EQ(add_group("three"), "");
    EXPECT_EQ(group("three")->gid, 992U);
}

TEST_F(GroupAdd, UnknownMembers) {
    EXPECT_EQ(add_group("new", {"alice", "nosuch", "other"}),
              "usermgmt 3: Failed to add group 'new', member #1 'nosuch' doesn't exist");
    EXPECT_EQ(add_group("new", {"nosuch"}),
              "usermgmt 3: Failed to add group 'new', member #0 'nosuch' doesn't exist");
    EXPECT_EQ(add_group("new", {""}),
              "usermgmt 3: Failed to add group 'new', member #0 '' doesn't exist");
    EXPECT_EQ(add_group("new", {"alice", "alice", "Alice"}),
              "usermgmt 3: Failed to add group 'new', member #2 'Alice' doesn't exist");
    // The GID is chosen before the members are looked at.
    write("group", GROUP + "last:x:500:\n");
    reopen();
    EXPECT_EQ(add_group("new", {"nosuch"}),
              "usermgmt 14: Failed to add group 'new', No more available GIDs in the dynamic "
              "system range (500 - 999)");
    expect_nothing_changed();
}

TEST_F(GroupAdd, WithoutEntriesThereIsACriticalAndNoError) {
    GPtrArray *entries = std::exchange(ctx_->group_db.entries, nullptr);
    error_slot error;
    EXPECT_EQ(glib_log_of([&] {
                  EXPECT_FALSE(usermgmt_add_group(ctx_.get(), "new", nullptr, error.out()));
              }),
              lines{"usermgmt-CRITICAL: find_next_gid: assertion 'ctx->group_db.entries != NULL' "
                    "failed"});
    EXPECT_FALSE(error.is_set());
    ctx_->group_db.entries = entries;
    expect_nothing_changed();
}

class GroupDelete : public ChangedAccounts {};

TEST_F(GroupDelete, MissingArguments) {
    usermgmt_ctx closed = {};
    error_slot error;
    for (usermgmt_ctx *ctx : {static_cast<usermgmt_ctx *>(nullptr), &closed}) {
        EXPECT_FALSE(usermgmt_delete_group(ctx, nullptr, error.out()));
        EXPECT_EQ(error.text(),
                  "usermgmt 17: Failed to delete group: Invalid or uninitialised context");
    }
    EXPECT_FALSE(usermgmt_delete_group(ctx_.get(), nullptr, error.out()));
    EXPECT_EQ(error.text(),
              "usermgmt 17: Failed to delete group: Invalid or missing 'groupname' argument");
    expect_nothing_changed();
}

TEST_F(GroupDelete, Refusals) {
    struct refusal_case {
        const char *groupname;
        const char *error;
    };
    static constexpr refusal_case cases[] = {
        {"nosuch",  "usermgmt 7: Failed to delete group 'nosuch', group does not exist"         },
        {"",        "usermgmt 7: Failed to delete group '', group does not exist"               },
        {"root",
         "usermgmt 11: Failed to delete group 'root', group type 'root' with GID 0 cannot be "
         "deleted"                                                                              },
        {"video",
         "usermgmt 11: Failed to delete group 'video', group type 'permanent system' with GID 44 "
         "cannot be deleted"                                                                    },
        {"users",
         "usermgmt 11: Failed to delete group 'users', group type 'permanent system' with GID 100 "
         "cannot be deleted"                                                                    },
        {"nogroup",
         "usermgmt 11: Failed to delete group 'nogroup', group type 'nobody' with GID 65534 cannot "
         "be deleted"                                                                           },
        {"camera",  "usermgmt 8: Failed to delete group 'camera', primary group for user 'camd'"},
    };
    for (const refusal_case &row : cases) {
        EXPECT_EQ(delete_group(row.groupname), row.error);
        EXPECT_FALSE(usermgmt_delete_group(ctx_.get(), row.groupname, nullptr));
        expect_nothing_changed();
    }
}

TEST_F(GroupDelete, NvrGroup) {
    EXPECT_EQ(delete_group("nvr"), "");
    expect_files(PASSWD, SHADOW, edited(GROUP, "nvr:x:60005:\n", ""));
    EXPECT_EQ(replaced(), lines{"group"});
    expect_memory_on_disk();
}

TEST_F(GroupDelete, GroupWithMembersWhosePrimaryGroupIsAnother) {
    EXPECT_EQ(add_group("sound", {"alice", "bob"}), "");
    EXPECT_EQ(delete_group("sound"), "");
    expect_files(PASSWD, SHADOW, GROUP);
    EXPECT_FALSE(usermgmt_group_exists(ctx_.get(), "sound"));
    EXPECT_TRUE(usermgmt_user_exists(ctx_.get(), "alice"));
    expect_memory_on_disk();
}

// Only listed members are looked at.
TEST_F(GroupDelete, PrimaryGroupOfAUserThatItDoesNotList) {
    write("group", edited(GROUP, "camera:x:995:camd\n", "camera:x:995:\n"));
    reopen();
    EXPECT_EQ(delete_group("camera"), "");
    EXPECT_EQ(with_members_sorted(read("group")), edited(GROUP, "camera:x:995:camd\n", ""));
    EXPECT_EQ(read("passwd"), PASSWD);
}

TEST_F(GroupDelete, MemberThatIsNoUserLoadsEverythingAgain) {
    EXPECT_EQ(add_group("sound", {"bob"}), "");
    EXPECT_EQ(add({.type = 3, .name = "svc", .group = "users"}), "");
    (void)g_hash_table_add(group("camera")->members, g_strdup("ghost"));
    (void)g_hash_table_remove(group("camera")->members, "camd");
    EXPECT_EQ(delete_group("camera"),
              "usermgmt 16: Failed to delete group 'camera', user/group database out of sync");
    EXPECT_EQ(take_syslog(), lines{"3 User/group DB mismatch (user 'ghost' not in grp 'camera'!"});
    // The state at open: what was added since is gone from memory.
    EXPECT_FALSE(usermgmt_group_exists(ctx_.get(), "sound"));
    EXPECT_FALSE(usermgmt_user_exists(ctx_.get(), "svc"));
    EXPECT_EQ(members("camera"), "camd");
    EXPECT_NE(read("passwd").find("svc:"), std::string::npos);
}

// The later of two groups with one GID holds the index; without it the other cannot be removed
// whole, but is gone all the same.
TEST_F(GroupDelete, OfTwoGroupsWithOneGid) {
    write("group", GROUP + "twin:x:700:\nother:x:700:bob\n");
    reopen();
    EXPECT_EQ(delete_group("twin"), "");
    EXPECT_EQ(with_members_sorted(read("group")), GROUP + "other:x:700:bob\n");
    EXPECT_TRUE(usermgmt_group_exists(ctx_.get(), "other"));
    EXPECT_EQ(replaced(), lines{"group"});

    EXPECT_EQ(delete_group("other"),
              "usermgmt 16: Failed to delete group 'other', could not remove group from internal "
              "structures");
    EXPECT_EQ(replaced(), lines());
    EXPECT_FALSE(usermgmt_group_exists(ctx_.get(), "other"));
    EXPECT_TRUE(ctx_->group_db.dirty);
    EXPECT_EQ(add_group("next"), "");
    EXPECT_EQ(with_members_sorted(read("group")), GROUP + "next::994:\n");
}

TEST_F(GroupDelete, OfTwoGroupsWithOneNameTheFirstWasLoaded) {
    write("group", GROUP + "sound:x:700:\nsound:x:701:bob\n");
    ctx_.reset();
    ctx_.reset(usermgmt_open(USERMGMT_OPEN_TRYLOCK, nullptr));
    EXPECT_EQ(take_syslog(), lines{"4 Skipping duplicate group entry 'sound'"});
    EXPECT_EQ(delete_group("sound"), "");
    EXPECT_EQ(with_members_sorted(read("group")), GROUP);
}

TEST_F(GroupDelete, WithoutEntriesNothingIsRemoved) {
    GPtrArray *entries = std::exchange(ctx_->group_db.entries, nullptr);
    EXPECT_EQ(glib_log_of([this] {
                  EXPECT_EQ(delete_group("nvr"),
                            "usermgmt 16: Failed to delete group 'nvr', could not remove group "
                            "from internal structures");
              }),
              lines{"usermgmt-CRITICAL: group_database_remove: assertion 'group_db->entries != "
                    "NULL' failed"});
    ctx_->group_db.entries = entries;
    expect_nothing_changed();
}

// A record without its place among the entries: gone from the indexes, and nothing loaded again.
TEST_F(GroupDelete, RecordThatIsNotAmongTheEntries) {
    guint index = 0;
    ASSERT_TRUE(g_ptr_array_find(ctx_->group_db.entries, group("nvr"), &index));
    auto *nvr =
        static_cast<internal_group *>(g_ptr_array_steal_index(ctx_->group_db.entries, index));
    EXPECT_EQ(delete_group("nvr"),
              "usermgmt 16: Failed to delete group 'nvr', could not remove group from internal "
              "structures");
    EXPECT_FALSE(usermgmt_group_exists(ctx_.get(), "nvr"));
    EXPECT_EQ(group_database_find_gid(&ctx_->group_db, 60005), nullptr);
    EXPECT_TRUE(ctx_->group_db.dirty);
    EXPECT_EQ(replaced(), lines());
    internal_group_free(nvr);
}

TEST(GroupModify, IsNeverSupported) {
    usermgmt_ctx ctx = {};
    error_slot error;
    static constexpr const char *UNUSABLE =
        "usermgmt 17: Failed to modify group: Invalid or uninitialised context";
    EXPECT_FALSE(usermgmt_modify_group(nullptr, "video", nullptr, nullptr, error.out()));
    EXPECT_EQ(error.text(), UNUSABLE);
    EXPECT_FALSE(usermgmt_modify_group(&ctx, nullptr, nullptr, nullptr, error.out()));
    EXPECT_EQ(error.text(), UNUSABLE);
    ctx.initialised = TRUE;
    EXPECT_FALSE(usermgmt_modify_group(&ctx, nullptr, nullptr, nullptr, error.out()));
    EXPECT_EQ(error.text(),
              "usermgmt 17: Failed to modify group: Invalid or missing 'groupname' argument");
    for (const char *name : {"video", "nosuch", ""}) {
        EXPECT_FALSE(usermgmt_modify_group(&ctx, name, "a", "b", error.out()));
        EXPECT_EQ(error.text(), "usermgmt 18: Group modification unsupported");
        EXPECT_FALSE(usermgmt_modify_group(&ctx, name, nullptr, nullptr, nullptr));
    }
}
