// usermgmt/account_types.cpp: the ID ranges and the type of an ID.
#include "usermgmt/account_types.h"

#include <array>

#include "usermgmt/usermgmt.h"

// Deliberate: the tables differ. Users have an "ornet" range and no range 60001 to 60010, groups
// have no range 1000 to 60000, and the "nobody" rows run in different directions.
static constexpr std::array<id_range, 6> user_ranges = {
    {
     {RANGE_TYPE_NONE, USER_TYPE_NONE, "none", FALSE, 0, 0},
     {RANGE_TYPE_USER, USER_TYPE_ROOT, "root", FALSE, 0, 0},
     {RANGE_TYPE_USER, USER_TYPE_PERMANENT, "permanent system", FALSE, 1, 499},
     {RANGE_TYPE_USER, USER_TYPE_DYNAMIC_SYSTEM, "dynamic system", TRUE, 500, 999},
     {RANGE_TYPE_USER, USER_TYPE_ORNET, "ornet", FALSE, 1000, 60000},
     {RANGE_TYPE_USER, USER_TYPE_NOBODY, "nobody", FALSE, 65534, 65534},
     }
};

static constexpr std::array<id_range, 6> group_ranges = {
    {
     {RANGE_TYPE_NONE, GROUP_TYPE_NONE, "none", FALSE, 0, 0},
     {RANGE_TYPE_GROUP, GROUP_TYPE_ROOT, "root", FALSE, 0, 0},
     {RANGE_TYPE_GROUP, GROUP_TYPE_PERMANENT_SYSTEM, "permanent system", FALSE, 1, 499},
     {RANGE_TYPE_GROUP, GROUP_TYPE_DYNAMIC_SYSTEM, "dynamic system", TRUE, 500, 999},
     {RANGE_TYPE_GROUP, GROUP_TYPE_NOBODY, "nobody", TRUE, 65534, 65534},
     {RANGE_TYPE_GROUP, GROUP_TYPE_PERMANENT_SYSTEM_NVR, "permanent system nvr", FALSE, 60001,
         60010},
     }
};

static consteval bool row_number_is_type(std::span<const id_range> table) {
    for (guint32 i = 0; i < table.size(); i++)
        if (table[i].type != i)
            return false;
    return true;
}
static_assert(row_number_is_type(user_ranges) && row_number_is_type(group_ranges));

const std::span<const id_range> user_range_table = user_ranges;
const std::span<const id_range> group_range_table = group_ranges;

// Deliberate: type 2 is called "permanent" here and "permanent system" in its range row.
static constexpr std::array user_type_names = {"none",           "root",  "permanent",
                                               "dynamic system", "ornet", "nobody"};
static constexpr std::array group_type_names = {"none",           "root",   "permanent system",
                                                "dynamic system", "nobody", "permanent system nvr"};

static guint32 type_of_id(std::span<const id_range> table, guint32 range_type, guint32 id) {
    for (const id_range &row : table)
        if (row.range_type == range_type && row.min <= id && id <= row.max)
            return row.type;
    return 0;
}

guint32 user_type_of_uid(guint32 uid) {
    return type_of_id(user_ranges, RANGE_TYPE_USER, uid);
}

guint32 group_type_of_gid(guint32 gid) {
    return type_of_id(group_ranges, RANGE_TYPE_GROUP, gid);
}

const char *user_type_name(guint32 type) {
    return type < user_type_names.size() ? user_type_names[type] : "invalid";
}

const char *group_type_name(guint32 type) {
    return type < group_type_names.size() ? group_type_names[type] : "invalid";
}
