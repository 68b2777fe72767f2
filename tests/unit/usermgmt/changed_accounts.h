// tests/unit/usermgmt/changed_accounts.h: a device's accounts, the operations that change them, and
// what they leave in memory and on disk.
#pragma once

#include <optional>

#include "tests/unit/usermgmt/account_files.h"
#include "tests/unit/usermgmt/hashing_sources.h"
#include "tests/unit/usermgmt/io_trace.h"
#include "usermgmt/context.h"

// An entry as a literal; what is left out stays absent.
struct entry_fields {
    guint32 type = USER_TYPE_NONE;
    const char *name = nullptr;
    const char *password = nullptr;
    const char *group = nullptr;
    std::optional<std::vector<const char *>> groups = std::nullopt;
    const char *gecos = nullptr;
    const char *shell = nullptr;
    gint32 uid = -1;
};

class filled_entry {
  public:
    explicit filled_entry(const entry_fields &fields);
    ~filled_entry() { usermgmt_free_user_entry(&entry_); }
    filled_entry(const filled_entry &) = delete;
    filled_entry &operator=(const filled_entry &) = delete;
    const user_entry *get() const { return &entry_; }

  private:
    user_entry entry_ = {};
};

// The text with one place changed, which must be there exactly once.
std::string edited(const std::string &text, const std::string &from, const std::string &to);

// The databases of a context, a line for each record and one for the dirty flag, with the members
// of a group sorted. A record that an index does not lead to says so.
struct databases {
    lines users;
    lines groups;
};
databases memory_of(const usermgmt_ctx *ctx);
// The same as the files would tell it: "*" for no password, whole days, a comment of one line.
databases memory_as_written(const usermgmt_ctx *ctx);

// Accounts of every type in files that a rewrite leaves as they are, on day 20000.
class ChangedAccounts : public AccountFiles {
  protected:
    static constexpr gint64 DAY = 20000;
    static constexpr const char *ALICES_HASH =
        "$5$abcdefghijkl$ZhmwPkHXQKf6apCu9HM2IbJzghxfHTPgWq9JleS3MrD";  // of "alicepass"
    static const std::string PASSWD;
    static const std::string SHADOW;
    static const std::string GROUP;

    void SetUp() override;
    void TearDown() override;

    // Each returns the text of the error ("" on success), after which no .tmp file may be there.
    std::string add(const char *username, const entry_fields &fields);
    std::string add(const entry_fields &fields) { return add(fields.name, fields); }
    std::string modify(const char *username, const entry_fields &fields);
    std::string delete_user(const char *username);
    std::string disable(const char *username);
    std::string add_group(const char *groupname, std::vector<const char *> members = {});
    std::string delete_group(const char *groupname);

    void reopen(guint32 flags = 0);
    internal_user *user(const char *name) { return user_database_find(&ctx_->user_db, name); }
    internal_group *group(const char *name) { return group_database_find(&ctx_->group_db, name); }
    // Members of a group, sorted and separated by commas.
    std::string members(const char *name);
    databases memory() const { return memory_of(ctx_.get()); }

    // Names of the files that were replaced since the last call or the set-up.
    lines replaced();
    // Compares all three files, group members sorted.
    static void expect_files(const std::string &passwd, const std::string &shadow,
                             const std::string &group);
    // Expects neither memory nor files changed since remember(), which set-up and reopen call.
    void remember();
    void expect_nothing_changed();

    // Memory must say what a context that reads the files says.
    void expect_memory_on_disk();

    // The hash in the shadow file, after a check that it is a fresh one of the password.
    static std::string fresh_hash(const std::string &name, const char *password);

    hashing_sources sources_;
    open_context ctx_;

  private:
    std::string outcome(gboolean succeeded, error_slot &error);

    struct identity {
        guint64 inode;
        gint64 seconds;
        gint64 nanoseconds;
        bool operator==(const identity &other) const = default;
    };
    static std::map<std::string, identity> identities();

    std::map<std::string, identity> last_identities_;
    databases last_memory_;
    lines last_texts_;
};
