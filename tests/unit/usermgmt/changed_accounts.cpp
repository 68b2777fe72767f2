// tests/unit/usermgmt/changed_accounts.cpp: a device's accounts, the operations that change them,
// and what they leave in memory and on disk.
#include "tests/unit/usermgmt/changed_accounts.h"

#include <crypt.h>
#include <sys/stat.h>

#include <algorithm>
#include <set>

#include "usermgmt/usermgmt.h"

const std::string ChangedAccounts::PASSWD =
    "root:x:0:0:root:/root:/bin/sh\n"
    "daemon:x:1:1:daemon:/usr/sbin:/bin/false\n"
    "anonymous:x:100:100:Visitor:/:/bin/false\n"
    "guest:x:101:100:::/bin/false\n"
    "camd:x:990:995:Camera:/var/lib/camd:/bin/false\n"
    "alice:x:1000:100:Alice:/home/alice:/bin/false\n"
    "bob:x:1005:100:::/bin/false\n"
    "nobody:*:65534:65534:nobody:/:/bin/false\n";
const std::string ChangedAccounts::SHADOW =
    "root:$6$rootsalt$roothash:19000:0:99999:7:0::\n"
    "daemon:*:19001:0:99999:7:0::\n"
    "anonymous:!:19002:0:99999:7:0::\n"
    "guest:$1$saltsalt$cCPENxTVtU4kpnV2ngztX0:19003:0:99999:7:0::\n"
    "camd:$5$ZZZZZZZZZZZZ$zudeleVaZfzgzvtsL.HxHI5hndEd6eifjOotGYM6oD5:19004:0:99999:7:0::\n"
    "alice:$5$abcdefghijkl$ZhmwPkHXQKf6apCu9HM2IbJzghxfHTPgWq9JleS3MrD:19005:0:99999:7:0::\n"
    "bob:$5$0123456789ab$WctjxrUYwM56UM6eXD1UUbn9rUhSi7nLdBfHMfG0PTB:19006:0:99999:7:0::\n";
const std::string ChangedAccounts::GROUP =
    "root:x:0:\n"
    "daemon:x:1:\n"
    "video:x:44:alice\n"
    "audio:x:45:alice,bob\n"
    "users:x:100:alice,bob\n"
    "camera:x:995:camd\n"
    "nvr:x:60005:\n"
    "nogroup:x:65534:\n";

filled_entry::filled_entry(const entry_fields &fields) {
    std::vector<const char *> groups = fields.groups.value_or(std::vector<const char *>());
    groups.push_back(nullptr);
    usermgmt_populate_user_entry(&entry_, fields.type, fields.name, fields.password, fields.group,
                                 fields.groups ? groups.data() : nullptr, fields.shell,
                                 fields.gecos, fields.uid);
}

std::string edited(const std::string &text, const std::string &from, const std::string &to) {
    const std::size_t place = text.find(from);
    EXPECT_NE(place, std::string::npos) << from;
    EXPECT_EQ(text.find(from, place + 1), std::string::npos) << from;
    return place == std::string::npos ? text : std::string(text).replace(place, from.size(), to);
}

static std::string shown(const char *text) {
    return text != nullptr ? "'" + std::string(text) + "'" : "none";
}

static std::string sorted_names(GHashTable *set) {
    std::set<std::string> names;
    GHashTableIter iter;
    gpointer name;
    g_hash_table_iter_init(&iter, set);
    while (g_hash_table_iter_next(&iter, &name, nullptr))
        names.insert(static_cast<const char *>(name));
    std::string joined;
    for (const std::string &member : names)
        joined += (joined.empty() ? "" : ",") + member;
    return joined;
}

static std::string shown_user(const internal_user *user, bool as_written) {
    const bool absent = user->password == nullptr;
    std::string gecos = user->gecos != nullptr ? user->gecos : "";
    gint64 last_change = user->last_change;
    if (as_written) {
        std::replace_if(
            gecos.begin(), gecos.end(), [](char c) { return c == ':' || c == '\n'; }, ' ');
        last_change = user->shadowed ? last_change / 86400 * 86400 : 0;
    }
    return shown(user->name) + " type " + std::to_string(user->type) +
           (user->shadowed ? " shadowed " : " plain ") +
           shown(absent && as_written ? "*" : user->password) + " ids " +
           std::to_string(user->uid) + ":" + std::to_string(user->gid) + " gecos '" + gecos +
           "' home '" + (user->home != nullptr ? user->home : "") + "' shell '" +
           (user->shell != nullptr ? user->shell : "") + "' changed " + std::to_string(last_change);
}

static lines shown_users(const usermgmt_ctx *ctx, bool as_written) {
    lines texts;
    for (const internal_user *user : records<const internal_user>(ctx->user_db.entries)) {
        const bool found = user_database_find(&ctx->user_db, user->name) == user;
        texts.push_back("user " + shown_user(user, as_written) + (found ? "" : " not in index"));
    }
    texts.push_back("users dirty " + std::to_string(ctx->user_db.dirty) + " index " +
                    std::to_string(g_hash_table_size(ctx->user_db.name_hash)));
    return texts;
}

static lines shown_groups(const usermgmt_ctx *ctx) {
    lines texts;
    for (const internal_group *group : records<const internal_group>(ctx->group_db.entries)) {
        const bool found = group_database_find(&ctx->group_db, group->name) == group;
        const bool by_gid = group_database_find_gid(&ctx->group_db, group->gid) == group;
        texts.push_back("group " + shown(group->name) + " type " + std::to_string(group->type) +
                        " password " + shown(group->password) + " gid " +
                        std::to_string(group->gid) + " members " + sorted_names(group->members) +
                        (found ? "" : " not in index") + (by_gid ? "" : " not in GID index"));
    }
    texts.push_back("groups dirty " + std::to_string(ctx->group_db.dirty) + " index " +
                    std::to_string(g_hash_table_size(ctx->group_db.name_hash)));
    return texts;
}

databases memory_of(const usermgmt_ctx *ctx) {
    return {shown_users(ctx, false), shown_groups(ctx)};
}

databases memory_as_written(const usermgmt_ctx *ctx) {
    return {shown_users(ctx, true), shown_groups(ctx)};
}

void ChangedAccounts::SetUp() {
    AccountFiles::SetUp();
    write("passwd", PASSWD);
    write("shadow", SHADOW);
    write("group", GROUP);
    sources_.now = DAY * 86400 + 4000;
    reopen();
}

void ChangedAccounts::TearDown() {
    ctx_.reset();
    AccountFiles::TearDown();
}

std::string ChangedAccounts::outcome(gboolean succeeded, error_slot &error) {
    EXPECT_EQ(succeeded == FALSE, error.is_set());
    for (const std::string &name : files())
        EXPECT_EQ(name.find(".tmp"), std::string::npos) << name;
    return error.text();
}

std::string ChangedAccounts::add(const char *username, const entry_fields &fields) {
    error_slot error;
    const filled_entry entry(fields);
    return outcome(usermgmt_add_user(ctx_.get(), username, entry.get(), error.out()), error);
}

std::string ChangedAccounts::modify(const char *username, const entry_fields &fields) {
    error_slot error;
    const filled_entry entry(fields);
    return outcome(usermgmt_modify_user(ctx_.get(), username, entry.get(), error.out()), error);
}

std::string ChangedAccounts::delete_user(const char *username) {
    error_slot error;
    return outcome(usermgmt_delete_user(ctx_.get(), username, error.out()), error);
}

std::string ChangedAccounts::disable(const char *username) {
    error_slot error;
    return outcome(usermgmt_disable_password(ctx_.get(), username, error.out()), error);
}

std::string ChangedAccounts::add_group(const char *groupname, std::vector<const char *> members) {
    error_slot error;
    members.push_back(nullptr);
    return outcome(usermgmt_add_group(ctx_.get(), groupname, members.data(), error.out()), error);
}

std::string ChangedAccounts::delete_group(const char *groupname) {
    error_slot error;
    return outcome(usermgmt_delete_group(ctx_.get(), groupname, error.out()), error);
}

void ChangedAccounts::reopen(guint32 flags) {
    ctx_.reset();
    ctx_ = opened(flags);
    ASSERT_NE(ctx_, nullptr);
    remember();
}

std::string ChangedAccounts::members(const char *name) {
    const internal_group *found = group(name);
    return found != nullptr ? sorted_names(found->members) : "(no group)";
}

std::map<std::string, ChangedAccounts::identity> ChangedAccounts::identities() {
    std::map<std::string, identity> found;
    for (const std::string &name : files()) {
        struct stat st = {};
        EXPECT_EQ(stat(("etc/" + name).c_str(), &st), 0);
        found[name] = {st.st_ino, st.st_mtim.tv_sec, st.st_mtim.tv_nsec};
    }
    return found;
}

lines ChangedAccounts::replaced() {
    const std::map<std::string, identity> now = identities();
    lines names;
    for (const auto &[name, id] : now)
        if (last_identities_.count(name) == 0 || last_identities_.at(name) != id)
            names.push_back(name);
    last_identities_ = now;
    return names;
}

void ChangedAccounts::expect_files(const std::string &passwd, const std::string &shadow,
                                   const std::string &group) {
    EXPECT_EQ(read("passwd"), passwd);
    EXPECT_EQ(read("shadow"), shadow);
    EXPECT_EQ(with_members_sorted(read("group")), group);
    EXPECT_EQ(files(), (lines{"group", "passwd", "shadow"}));
}

void ChangedAccounts::remember() {
    last_identities_ = identities();
    last_memory_ = memory();
    last_texts_ = {read("passwd"), read("shadow"), read("group")};
}

void ChangedAccounts::expect_nothing_changed() {
    EXPECT_EQ(memory().users, last_memory_.users);
    EXPECT_EQ(memory().groups, last_memory_.groups);
    EXPECT_EQ(replaced(), lines());
    EXPECT_EQ((lines{read("passwd"), read("shadow"), read("group")}), last_texts_);
}

void ChangedAccounts::expect_memory_on_disk() {
    const databases in_memory = memory_as_written(ctx_.get());
    reopen();
    EXPECT_EQ(memory_as_written(ctx_.get()).users, in_memory.users);
    EXPECT_EQ(memory_as_written(ctx_.get()).groups, in_memory.groups);
}

std::string ChangedAccounts::fresh_hash(const std::string &name, const char *password) {
    const std::string shadow = "\n" + read("shadow");
    const std::size_t start = shadow.find("\n" + name + ":") + name.size() + 2;
    const std::string hash = shadow.substr(start, shadow.find(':', start) - start);
    EXPECT_TRUE(g_regex_match_simple("^\\$5\\$[./0-9A-Za-z]{12}\\$[./0-9A-Za-z]{43}$", hash.c_str(),
                                     G_REGEX_DEFAULT, G_REGEX_MATCH_DEFAULT))
        << hash;
    static struct crypt_data scratch;
    const char *again = crypt_r(password, hash.c_str(), &scratch);
    EXPECT_EQ(again, hash) << name;
    return hash;
}
