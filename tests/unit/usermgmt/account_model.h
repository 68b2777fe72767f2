// tests/unit/usermgmt/account_model.h: what operations have to leave in memory and on disk, worked
// out by rules of its own.
#pragma once

#include <set>
#include <string>
#include <vector>

#include "tests/unit/usermgmt/account_lines.h"
#include "tests/unit/usermgmt/random_operations.h"
#include "usermgmt/context.h"
#include "usermgmt/usermgmt.h"

// Bits of the mask of a reload.
enum load_bits : guint32 {
    LOAD_PASSWD = 2,
    LOAD_GROUP = 4,
    LOAD_SHADOW = 8,
    LOAD_EVERYTHING = 255,
};

// A hash that costs nothing in place of crypt's, in the same form.
std::string cheap_hash(const char *clear_text, const char *setting);

struct model_user {
    guint32 type;
    bool shadowed;
    std::string name;
    optional_text password;
    optional_text gecos;
    optional_text home;
    optional_text shell;
    guint32 uid;
    guint32 gid;
    gint64 last_change;
};

struct model_group {
    guint32 type;
    std::string name;
    optional_text password;
    guint32 gid;
    std::set<std::string> members;
};

// How an operation ended.
struct operation_result {
    bool succeeded;
    std::string error;
    bool fault_struck;     // the planned fault was met
    std::string new_hash;  // the last that was made
    gint64 now;
    // What a reload, where the operation asked for one, could not read.
    bool groups_unread = false;
    bool users_unread = false;
};

// Whether an operation succeeds it is told; what follows from that it knows.
class account_model {
  public:
    // From what the files hold.
    account_model(account_lines files, guint32 open_flags);
    // The database closed and opened again.
    void reopen();

    void follow(const operation &what, const operation_result &result);

    // How the database differs, "" when it does not.
    std::string difference_from(const usermgmt_ctx *ctx) const;
    // Whether the last operation has to load files again, and which it has to replace.
    bool reloaded() const { return reloaded_; }
    bool replaced(int row) const { return replaced_[row]; }
    const account_lines &disk() const { return disk_; }
    bool users_dirty() const { return users_dirty_; }
    bool groups_dirty() const { return groups_dirty_; }
    // Something that should not have succeeded, or "".
    const std::string &objection() const { return objection_; }

  private:
    // What a change asks of the write that follows; none where there is nothing to write.
    struct write_request {
        bool wanted = false;
        guint32 mask = 0;  // of the reload when it fails
    };

    void load_groups();
    void load_users();
    void reload(guint32 mask, const operation_result &result);
    // Replaces the files of the first rows, as far as they are to be written.
    void write(int rows);

    write_request change(const operation &what, const operation_result &result);
    void refused(const operation &what, const operation_result &result);
    write_request add_user(const operation &what, const operation_result &result);
    write_request modify_user(const operation &what, const operation_result &result);
    write_request delete_user(const operation &what);
    write_request disable_password(const operation &what);
    write_request add_group(const operation &what);
    write_request delete_group(const operation &what);
    void set_groups(const std::string &user, const std::string &primary,
                    const std::vector<std::string> &wanted);
    void set_password(model_user *user, const std::string &clear_text,
                      const operation_result &result);
    void require(bool condition, const char *text);
    bool no_cache() const { return (open_flags_ & USERMGMT_OPEN_NO_CACHE) != 0; }
    model_user *user(const std::string &name);
    model_group *group(const std::string &name);
    model_group *group_of(guint32 gid);

    guint32 open_flags_;
    account_lines disk_;
    account_lines cache_;
    std::vector<model_user> users_;
    std::vector<model_group> groups_;
    bool has_shadow_ = false;
    bool users_dirty_ = false;
    bool groups_dirty_ = false;
    bool reloaded_ = false;
    bool replaced_[CORE_FILE_COUNT] = {};
    std::string objection_;
};
