// usermgmt/account_records.h: users and groups as the databases hold them, internal to usermgmt.
#pragma once

#include <glib.h>

struct internal_user {
    guint32 type;
    gboolean shadowed;  // the password lives in the shadow file, the passwd file carries "x"
    // The strings but the password are freed and replaced only by the functions below: they stand
    // in a block of their own or in the record's.
    char *name;
    char *password;  // a crypt hash or whatever the field held; may be absent; wiped when freed
    char *gecos;     // may be absent
    char *home;
    char *shell;
    guint32 uid;
    guint32 gid;         // primary group
    gint64 last_change;  // of the password, seconds since the epoch; days above 24855 need 64 bits
    gsize room;  // bytes behind the record, in which internal_user_copy puts strings; else 0
};

struct internal_group {
    guint32 type;
    char *name;
    char *password;  // absent when the field was empty; wiped when freed
    guint32 gid;
    GHashTable *members;  // set of user names, owned
};

// Both accept null and half-built records.
void internal_user_free(internal_user *user);
void internal_group_free(internal_group *group);

// A copy of the record and its strings. All but the password stand behind it in its own block.
internal_user *internal_user_copy(const internal_user *user);

// Replaces one of the record's strings but the password; either may be absent.
void internal_user_replace_text(internal_user *user, char *internal_user::*text,
                                const char *wanted);

G_DEFINE_AUTOPTR_CLEANUP_FUNC(internal_user, internal_user_free)
G_DEFINE_AUTOPTR_CLEANUP_FUNC(internal_group, internal_group_free)

// An empty set of user names that owns its strings.
GHashTable *member_set_new();

// The records of a pointer array, typed, for a range-for loop.
template <typename record>
class records {
  public:
    class iterator {
      public:
        explicit iterator(gpointer *slot) : slot_(slot) {}
        record *operator*() const { return static_cast<record *>(*slot_); }
        iterator &operator++() {
            ++slot_;
            return *this;
        }
        bool operator==(const iterator &other) const = default;

      private:
        gpointer *slot_;
    };

    explicit records(const GPtrArray *array) : array_(array) {}
    iterator begin() const { return iterator(array_->pdata); }
    iterator end() const { return iterator(array_->pdata + array_->len); }

  private:
    const GPtrArray *array_;
};
