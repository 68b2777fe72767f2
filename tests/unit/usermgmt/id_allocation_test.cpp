// tests/unit/usermgmt/id_allocation_test.cpp: choosing the ID of a new account.
#include "usermgmt/id_allocation.h"

#include "tests/unit/usermgmt/account_files.h"
#include "usermgmt/context.h"

using ids = std::vector<guint32>;

// A context in memory with accounts of given IDs.
class IdAllocation : public testing::Test {
  protected:
    void SetUp() override {
        ctx_.initialised = TRUE;
        ctx_.user_db = user_database_new(0);
        ctx_.group_db = group_database_new(0);
    }
    void TearDown() override {
        user_database_clear(&ctx_.user_db);
        group_database_clear(&ctx_.group_db);
    }
    void have_users(const ids &uids) {
        user_database_clear(&ctx_.user_db);
        ctx_.user_db = user_database_new(0);
        for (const guint32 uid : uids)
            g_ptr_array_add(ctx_.user_db.entries, new_user({.uid = uid}));
    }
    void have_groups(const ids &gids) {
        group_database_clear(&ctx_.group_db);
        ctx_.group_db = group_database_new(0);
        for (const guint32 gid : gids)
            g_ptr_array_add(ctx_.group_db.entries, new_group({.gid = gid}));
    }
    // "lowest highest count" of what a row finds.
    static std::string found(const id_range &range, const GPtrArray *entries) {
        guint32 lowest = 0;
        guint32 highest = 0;
        guint count = 0;
        find_min_max_uid_gid(&range, entries, &lowest, &highest, &count);
        return std::to_string(lowest) + " " + std::to_string(highest) + " " + std::to_string(count);
    }
    // The ID, or the text of the error.
    std::string next_uid(guint32 type) {
        error_slot error;
        guint32 uid = 77;
        const bool done = find_next_uid(&ctx_, type, &uid, error.out());
        EXPECT_EQ(done, !error.is_set());
        EXPECT_TRUE(done || uid == 77);
        return done ? std::to_string(uid) : error.text();
    }
    std::string next_gid() {
        error_slot error;
        guint32 gid = 77;
        const bool done = find_next_gid(&ctx_, &gid, error.out());
        EXPECT_EQ(done, !error.is_set());
        EXPECT_TRUE(done || gid == 77);
        return done ? std::to_string(gid) : error.text();
    }
    static ids from_to(guint32 first, guint32 last) {
        ids all;
        for (guint32 id = first; id <= last; id++)
            all.push_back(id);
        return all;
    }

    usermgmt_ctx ctx_ = {};
};

TEST_F(IdAllocation, ScanOfUsers) {
    struct scan_case {
        guint32 type;
        ids uids;
        const char *found;
    };
    const scan_case cases[] = {
        {USER_TYPE_ORNET,          {},                     "0 0 0"        },
        {USER_TYPE_ORNET,          {0, 499, 999, 65534},   "0 0 0"        },
        {USER_TYPE_ORNET,          {1000},                 "1000 1000 1"  },
        {USER_TYPE_ORNET,          {1005, 1000, 60000, 1}, "1000 60000 3" },
        {USER_TYPE_ORNET,          {60000, 1000, 1000},    "1000 60000 3" },
        {USER_TYPE_DYNAMIC_SYSTEM, {499, 500, 999, 1000},  "500 999 2"    },
        {USER_TYPE_PERMANENT,      {0, 1, 499, 500},       "1 499 2"      },
        {USER_TYPE_NOBODY,         {65533, 65534, 65535},  "65534 65534 1"},
        {USER_TYPE_ROOT,           {0},                    "0 0 1"        },
        {USER_TYPE_ROOT,           {0, 0, 1},              "0 0 2"        },
    };
    for (const scan_case &row : cases) {
        have_users(row.uids);
        EXPECT_EQ(found(user_range_table[row.type], ctx_.user_db.entries), row.found) << row.type;
    }
}

TEST_F(IdAllocation, ScanOfGroups) {
    have_groups({0, 1, 499, 500, 700, 999, 1000, 60001, 60010, 65534});
    EXPECT_EQ(found(group_range_table[GROUP_TYPE_ROOT], ctx_.group_db.entries), "0 0 1");
    EXPECT_EQ(found(group_range_table[GROUP_TYPE_PERMANENT_SYSTEM], ctx_.group_db.entries),
              "1 499 2");
    EXPECT_EQ(found(group_range_table[GROUP_TYPE_DYNAMIC_SYSTEM], ctx_.group_db.entries),
              "500 999 3");
    EXPECT_EQ(found(group_range_table[GROUP_TYPE_NOBODY], ctx_.group_db.entries), "65534 65534 1");
    EXPECT_EQ(found(group_range_table[GROUP_TYPE_PERMANENT_SYSTEM_NVR], ctx_.group_db.entries),
              "60001 60010 2");
}

// An ID counts only in an account of the row's own type, and only inside the row.
TEST_F(IdAllocation, ScanWantsTypeAndRange) {
    have_users({1000, 2000, 990});
    static_cast<internal_user *>(g_ptr_array_index(ctx_.user_db.entries, 0))->type =
        USER_TYPE_NOBODY;
    static_cast<internal_user *>(g_ptr_array_index(ctx_.user_db.entries, 2))->type =
        USER_TYPE_ORNET;
    EXPECT_EQ(found(user_range_table[USER_TYPE_ORNET], ctx_.user_db.entries), "2000 2000 1");
}

TEST_F(IdAllocation, ScanSkipsEmptySlotsAndNeedsNoCount) {
    have_users({1000});
    g_ptr_array_insert(ctx_.user_db.entries, 0, nullptr);
    g_ptr_array_add(ctx_.user_db.entries, nullptr);
    const id_range *range = &user_range_table[USER_TYPE_ORNET];
    EXPECT_EQ(found(*range, ctx_.user_db.entries), "1000 1000 1");
    guint32 lowest = 0;
    guint32 highest = 0;
    find_min_max_uid_gid(range, ctx_.user_db.entries, &lowest, &highest, nullptr);
    EXPECT_EQ(lowest, 1000U);
    EXPECT_EQ(highest, 1000U);
}

TEST_F(IdAllocation, ScanAddsToTheCount) {
    have_users({1000, 1001});
    guint32 lowest = 0;
    guint32 highest = 0;
    guint count = 5;
    find_min_max_uid_gid(&user_range_table[USER_TYPE_ORNET], ctx_.user_db.entries, &lowest,
                         &highest, &count);
    EXPECT_EQ(count, 7U);
}

TEST_F(IdAllocation, ScanChecksItsArguments) {
    have_users({1000});
    const GPtrArray *users = ctx_.user_db.entries;
    const id_range *range = &user_range_table[USER_TYPE_ORNET];
    guint32 zero = 0;
    guint32 set = 5;
    static constexpr const char *MIN_TEXT =
        "usermgmt-CRITICAL: find_min_max_uid_gid: assertion "
        "'min_found != NULL && *min_found == 0' failed";
    static constexpr const char *MAX_TEXT =
        "usermgmt-CRITICAL: find_min_max_uid_gid: assertion "
        "'max_found != NULL && *max_found == 0' failed";
    const auto log_of = [&](const id_range *row, guint32 *lowest, guint32 *highest) {
        return glib_log_of([&] { find_min_max_uid_gid(row, users, lowest, highest, nullptr); });
    };
    EXPECT_EQ(log_of(range, nullptr, &zero), lines{MIN_TEXT});
    EXPECT_EQ(log_of(range, &set, &zero), lines{MIN_TEXT});
    EXPECT_EQ(log_of(range, &zero, nullptr), lines{MAX_TEXT});
    EXPECT_EQ(log_of(range, &zero, &set), lines{MAX_TEXT});
    guint32 other = 0;
    for (const guint32 range_type : {0U, 3U}) {
        id_range odd = *range;
        odd.range_type = range_type;
        EXPECT_EQ(log_of(&odd, &zero, &other),
                  lines{"usermgmt-CRITICAL: find_min_max_uid_gid: assertion 'range->range_type == "
                        "RANGE_TYPE_GROUP || range->range_type == RANGE_TYPE_USER' failed"});
    }
    EXPECT_EQ(zero, 0U);
    EXPECT_EQ(other, 0U);
    EXPECT_EQ(set, 5U);
}

TEST_F(IdAllocation, NextInARange) {
    struct next_case {
        const id_range *range;
        guint32 lowest;
        guint32 highest;
        const char *next;
    };
    const id_range *ornet = &user_range_table[USER_TYPE_ORNET];
    const id_range *dynamic = &user_range_table[USER_TYPE_DYNAMIC_SYSTEM];
    const id_range *user_nobody = &user_range_table[USER_TYPE_NOBODY];
    const id_range *group_nobody = &group_range_table[GROUP_TYPE_NOBODY];
    const id_range *nvr = &group_range_table[GROUP_TYPE_PERMANENT_SYSTEM_NVR];
    const next_case cases[] = {
        {ornet,        0,     0,     "1000" },
        {ornet,        1000,  1000,  "1001" },
        {ornet,        1000,  59999, "60000"},
        {ornet,        1000,  60000, "none" },
        {ornet,        60000, 60000, "none" },
        {dynamic,      0,     0,     "999"  },
        {dynamic,      999,   999,   "998"  },
        {dynamic,      700,   999,   "699"  },
        {dynamic,      501,   999,   "500"  },
        {dynamic,      500,   999,   "none" },
        {dynamic,      500,   500,   "none" },
        {user_nobody,  0,     0,     "65534"},
        {user_nobody,  65534, 65534, "none" },
        {group_nobody, 0,     0,     "65534"},
        {group_nobody, 65534, 65534, "none" },
        {nvr,          0,     0,     "60001"},
        {nvr,          60001, 60009, "60010"},
        {nvr,          60001, 60010, "none" },
    };
    for (const next_case &row : cases) {
        guint32 next = 77;
        const bool found = find_next_uid_gid_in_range(row.range, row.lowest, row.highest, &next);
        EXPECT_EQ(found ? std::to_string(next) : "none", row.next)
            << row.range->name << " " << row.lowest << " " << row.highest;
        EXPECT_TRUE(found || next == 77);
    }
}

TEST_F(IdAllocation, HighestWithoutLowestIsACritical) {
    guint32 next = 77;
    EXPECT_EQ(glib_log_of([&] {
                  EXPECT_FALSE(find_next_uid_gid_in_range(&user_range_table[USER_TYPE_ORNET], 0,
                                                          1000, &next));
              }),
              lines{"usermgmt-CRITICAL: find_next_uid_gid_in_range: assertion 'max_found == 0' "
                    "failed"});
    EXPECT_EQ(next, 77U);
}

TEST_F(IdAllocation, NextUid) {
    struct uid_case {
        guint32 type;
        ids uids;
        const char *next;
    };
    const uid_case cases[] = {
        {USER_TYPE_ORNET,          {},                 "1000"                              },
        {USER_TYPE_ORNET,          {0, 1, 999, 65534}, "1000"                              },
        {USER_TYPE_ORNET,          {1000},             "1001"                              },
        {USER_TYPE_ORNET,          {1000, 1005},       "1006"                              },
        {USER_TYPE_ORNET,          {1005},             "1006"                              },
        {USER_TYPE_ORNET,
         {60000},
         "usermgmt 13: No more available UIDs in the ornet range (1000 - 60000)"           },
        {USER_TYPE_DYNAMIC_SYSTEM, {},                 "999"                               },
        {USER_TYPE_DYNAMIC_SYSTEM, {999},              "998"                               },
        {USER_TYPE_DYNAMIC_SYSTEM, {700, 999},         "699"                               },
        {USER_TYPE_DYNAMIC_SYSTEM,
         {500},
         "usermgmt 13: No more available UIDs in the dynamic system range (500 - 999)"     },
        {USER_TYPE_PERMANENT,      {},                 "1"                                 },
        {USER_TYPE_PERMANENT,      {0, 100},           "101"                               },
        {USER_TYPE_PERMANENT,
         {499},
         "usermgmt 13: No more available UIDs in the permanent system range (1 - 499)"     },
        {USER_TYPE_NOBODY,         {},                 "65534"                             },
        {USER_TYPE_NOBODY,
         {65534},
         "usermgmt 13: No more available UIDs in the nobody range (65534 - 65534)"         },
        {USER_TYPE_ROOT,           {},                 "0"                                 },
 // An ID of 0 never counts as found.
        {USER_TYPE_ROOT,           {0},                "0"                                 },
        {USER_TYPE_NONE,           {},                 "usermgmt 9: Invalid user type '0'" },
        {6,                        {},                 "usermgmt 9: Invalid user type '6'" },
        {G_MAXUINT32,              {},                 "usermgmt 9: Invalid user type '-1'"},
    };
    for (const uid_case &row : cases) {
        have_users(row.uids);
        EXPECT_EQ(next_uid(row.type), row.next);
    }
}

TEST_F(IdAllocation, AtMostHundredOrnetUsers) {
    have_users(from_to(1000, 1098));
    EXPECT_EQ(next_uid(USER_TYPE_ORNET), "1099");
    have_users(from_to(1000, 1099));
    EXPECT_EQ(next_uid(USER_TYPE_ORNET),
              "usermgmt 13: Max number of ORNET users exceeded (max=100, current=100)");
    have_users(from_to(59880, 60000));
    EXPECT_EQ(next_uid(USER_TYPE_ORNET),
              "usermgmt 13: Max number of ORNET users exceeded (max=100, current=121)");
    have_users(from_to(600, 999));
    EXPECT_EQ(next_uid(USER_TYPE_DYNAMIC_SYSTEM), "599");
    EXPECT_EQ(next_uid(USER_TYPE_ORNET), "1000");
}

TEST_F(IdAllocation, NextGid) {
    struct gid_case {
        ids gids;
        const char *next;
    };
    static constexpr const char *NONE_LEFT =
        "usermgmt 14: No more available GIDs in the dynamic system range (500 - 999)";
    const gid_case cases[] = {
        {{},                           "999"    },
        {{0, 499, 60001, 65534, 1000}, "999"    },
        {{995},                        "994"    },
        {{999, 995, 997},              "994"    },
        {{501},                        "500"    },
        {{500},                        NONE_LEFT},
        {{999, 500},                   NONE_LEFT},
    };
    for (const gid_case &row : cases) {
        have_groups(row.gids);
        EXPECT_EQ(next_gid(), row.next);
    }
    have_groups(from_to(600, 999));
    EXPECT_EQ(next_gid(), "599");
}

TEST_F(IdAllocation, UnusableContextIsACriticalWithoutError) {
    error_slot error;
    guint32 id = 77;
    const auto log_of_uid = [&] {
        return glib_log_of(
            [&] { EXPECT_FALSE(find_next_uid(&ctx_, USER_TYPE_ORNET, &id, error.out())); });
    };
    const auto log_of_gid = [&] {
        return glib_log_of([&] { EXPECT_FALSE(find_next_gid(&ctx_, &id, error.out())); });
    };
    ctx_.initialised = FALSE;
    EXPECT_EQ(log_of_uid(), lines{"usermgmt-CRITICAL: find_next_uid: assertion 'ctx->initialised "
                                  "!= FALSE' failed"});
    EXPECT_EQ(log_of_gid(), lines{"usermgmt-CRITICAL: find_next_gid: assertion 'ctx->initialised "
                                  "!= FALSE' failed"});
    ctx_.initialised = TRUE;
    user_database_clear(&ctx_.user_db);
    group_database_clear(&ctx_.group_db);
    EXPECT_EQ(log_of_uid(), lines{"usermgmt-CRITICAL: find_next_uid: assertion "
                                  "'ctx->user_db.entries != NULL' failed"});
    EXPECT_EQ(log_of_gid(), lines{"usermgmt-CRITICAL: find_next_gid: assertion "
                                  "'ctx->group_db.entries != NULL' failed"});
    EXPECT_FALSE(error.is_set());
    EXPECT_EQ(id, 77U);
}

TEST_F(IdAllocation, RequestedUid) {
    error_slot error;
    have_users({1, 1000, 1002, 60000});
    for (const guint32 uid : {2U, 999U, 1001U, 59999U, 60001U, 65534U, 4294967295U})
        EXPECT_TRUE(set_uid_if_free(&ctx_, uid, error.out())) << uid << error.text();
    for (const guint32 uid : {1U, 1000U, 1002U, 60000U}) {
        EXPECT_FALSE(set_uid_if_free(&ctx_, uid, error.out())) << uid;
        EXPECT_EQ(error.text(), "usermgmt 17: specified UID is unavailable");
    }
    have_users({});
    EXPECT_TRUE(set_uid_if_free(&ctx_, 1000, error.out()));
}

TEST_F(IdAllocation, RequestedUidOfRootIsACriticalAndAnError) {
    error_slot error;
    for (const ids &uids : {ids{}, ids{0}, ids{1000}}) {
        have_users(uids);
        EXPECT_EQ(glib_log_of([&] { EXPECT_FALSE(set_uid_if_free(&ctx_, 0, error.out())); }),
                  lines{"usermgmt-CRITICAL: set_uid_if_free: assertion 'uid > (uid_t) 0' failed"});
        EXPECT_EQ(error.text(), "usermgmt 17: specified UID is unavailable");
    }
}
