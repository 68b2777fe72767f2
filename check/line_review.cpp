// check/line_review.cpp: compares the lines of the account files with what a write makes of them.
#include "check/line_review.h"

#include <cerrno>
#include <iterator>
#include <span>

#include "check/hash_cost.h"
#include "check/repeated_lines.h"
#include "check/unfinished_addition.h"
#include "usermgmt/account_types.h"

static constexpr std::size_t PASSWORD = 1, MEMBERS = 3, FIRST_AGE = 3;
static constexpr const char *ELSEWHERE = "x";
static constexpr const char *LOCKED = "*";

static constexpr const char *PASSWD_FIELDS[] = {"name",    "password",       "UID",  "GID",
                                                "comment", "home directory", "shell"};
static constexpr const char *SHADOW_FIELDS[] = {
    "name",           "password",          "day of the last change", "minimum age", "maximum age",
    "warning period", "inactivity period", "expiration day",         "flag"};
static constexpr const char *GROUP_FIELDS[] = {"name", "password", "GID", "members"};
static constexpr std::span<const char *const> FIELD_NAMES[] = {PASSWD_FIELDS, SHADOW_FIELDS,
                                                               GROUP_FIELDS};

// Names, which belong to the lines or the database.
static GHashTable *name_table_new() {
    return g_hash_table_new(g_str_hash, g_str_equal);
}

static bool has_name(GHashTable *names, const char *name) {
    return g_hash_table_contains(names, name) == TRUE;
}

static void count_one(GHashTable *counts, const char *name) {
    const guint count = GPOINTER_TO_UINT(g_hash_table_lookup(counts, name));
    (void)g_hash_table_insert(counts, const_cast<char *>(name), GUINT_TO_POINTER(count + 1));
}

// False where none is left.
static bool take_one(GHashTable *counts, const char *name) {
    const guint count = GPOINTER_TO_UINT(g_hash_table_lookup(counts, name));
    if (count > 0)
        (void)g_hash_table_insert(counts, const_cast<char *>(name), GUINT_TO_POINTER(count - 1));
    return count > 0;
}

// False where it was there.
static bool add_name(GHashTable *names, const char *name) {
    return g_hash_table_add(names, const_cast<char *>(name)) == TRUE;
}

class line_review {
  public:
    line_review(const account_file (&files)[CORE_FILE_COUNT], const usermgmt_ctx *ctx,
                findings *out)
        : files_(files), ctx_(ctx), out_(out) {}
    ~line_review() {
        g_hash_table_unref(shadowed_);
        g_hash_table_unref(due_);
        g_ptr_array_unref(kept_);
        g_hash_table_unref(users_);
        g_hash_table_unref(shadow_names_);
    }
    line_review(const line_review &) = delete;
    line_review &operator=(const line_review &) = delete;
    void run();

  private:
    void add(gravity weight, const char *kind, int row, const account_line &line, char *text);
    void add_of_file(gravity weight, const char *kind, int row, const account_line &line,
                     const char *text);
    void review_others(int row);
    void review_malformed(int row, const account_line &line);
    void review_passwd();
    void review_shadow();
    void review_added_shadow_lines();
    void review_order();
    void review_groups();
    void explain_lost_user(const account_line &line);
    void explain_lost_group(const account_line &line);
    void compare(int row, const account_line &line, const void *record);
    void review_members(const account_line &line);
    void review_hash(int row, const account_line &line);
    void review_root();

    const account_file (&files_)[CORE_FILE_COUNT];
    const usermgmt_ctx *ctx_;
    findings *out_;
    // Of the users that have lines in the shadow file once it is written: one of that name (all
    // have the same line), and how many lines are to come.
    GHashTable *shadowed_ = name_table_new();
    GHashTable *due_ = name_table_new();
    GPtrArray *kept_ = g_ptr_array_new();   // the names of the lines that are there already
    GHashTable *users_ = name_table_new();  // those with a line in passwd
    GHashTable *shadow_names_ = name_table_new();
};

// Takes the text.
void line_review::add(gravity weight, const char *kind, int row, const account_line &line,
                      char *text) {
    out_->add(weight, kind, core_file_table[row].path, line.number, line.name, text);
}

// Of no account.
void line_review::add_of_file(gravity weight, const char *kind, int row, const account_line &line,
                              const char *text) {
    out_->add(weight, kind, core_file_table[row].path, line.number, nullptr, g_strdup(text));
}

// Nobody can log in by it, but it may have been meant for an account.
void line_review::review_malformed(int row, const account_line &line) {
    const std::string_view name = line.field(0);
    const bool looks_like_account = row != CORE_FILE_ROW_SHADOW && !name.empty() &&
                                    line.field_count() >= std::size(GROUP_FIELDS);
    g_autofree char *account = looks_like_account ? g_strndup(name.data(), name.size()) : nullptr;

    out_->add(looks_like_account ? gravity::LOSS : gravity::CHANGE, "malformed-line",
              core_file_table[row].path, line.number, account,
              g_strdup("no entry by the C library's rules; a write drops the line"));
}

// Lines that are no entries, and a last line without its end.
void line_review::review_others(int row) {
    const account_line *last = nullptr;

    for (const account_line *line : lines_of(files_[row])) {
        const std::string_view text(line->text, line->length);
        const std::size_t first = text.find_first_not_of(" \t");
        last = line;
        if (line->is_entry)
            continue;
        if (first == std::string_view::npos)
            add_of_file(gravity::CHANGE, "blank-line", row, *line,
                        "a blank line, which a write drops");
        else if (text[first] == '#')
            add_of_file(gravity::CHANGE, "comment", row, *line, "a comment, which a write drops");
        else
            review_malformed(row, *line);
    }
    if (files_[row].lacks_last_end && last != nullptr)
        add_of_file(gravity::CHANGE, "no-line-end", row, *last,
                    "the last line has no end; a write adds it");
}

static bool has_repeated_member(const account_line &line) {
    for (guint i = 1; line.members != nullptr && i < line.members->len; i++)
        if (g_strcmp0(static_cast<const char *>(line.members->pdata[i - 1]),
                      static_cast<const char *>(line.members->pdata[i])) == 0)
            return true;
    return false;
}

// What becomes of a field, in words; null where it means the same.
static char *change_of_field(int row, std::size_t index, const account_line &line,
                             std::string_view written) {
    const std::string_view old = line.field(index);

    if (old == written)
        return nullptr;
    if (row == CORE_FILE_ROW_GROUP && index == MEMBERS)  // of a set, whose order means nothing
        return has_repeated_member(line) ? g_strdup("each member is listed once") : nullptr;
    if (index != PASSWORD) {
        g_autofree char *before = g_strndup(old.data(), old.size());
        g_autofree char *after = g_strndup(written.data(), written.size());
        return g_strdup_printf("the %s \"%s\" becomes \"%s\"", FIELD_NAMES[row][index], before,
                               after);
    }
    if (written == ELSEWHERE || written == LOCKED)
        return g_strdup_printf("the password field becomes \"%c\"", written[0]);
    return g_strdup("the password field becomes another");
}

static void append_change(GString *changes, const char *change) {
    g_string_append_printf(changes, "%s%s", changes->len > 0 ? "; " : "", change);
}

void line_review::compare(int row, const account_line &line, const void *record) {
    g_auto(account_line) written = {};
    g_autoptr(GString) changes = g_string_new(nullptr);
    bool is_ageing = row == CORE_FILE_ROW_SHADOW;

    if (!write_account_line(core_file_table[row], record, &written)) {
        add(gravity::UNUSABLE, "unwritable", row, line,
            g_strdup_printf("cannot be written, and so no change of any account can: %m"));
        return;
    }
    for (std::size_t i = 0; i < FIELD_NAMES[row].size(); i++) {
        g_autofree char *change = change_of_field(row, i, line, written.field(i));
        if (change == nullptr)
            continue;
        is_ageing = is_ageing && i >= FIRST_AGE;
        append_change(changes, change);
    }
    if (line.field_count() > FIELD_NAMES[row].size())
        append_change(changes, "what follows the last field is dropped");
    if (changes->len > 0)
        add(gravity::CHANGE, is_ageing ? "ageing" : "fields", row, line, g_strdup(changes->str));
}

void line_review::explain_lost_user(const account_line &line) {
    static constexpr int ROW = CORE_FILE_ROW_PASSWD;

    const bool lacks_shadow_line =
        line.field(PASSWORD) == ELSEWHERE && !has_name(shadow_names_, line.name);
    if (lacks_shadow_line && is_unfinished_addition(files_, line))
        add(gravity::CHANGE, "unfinished-addition", ROW, line,
            g_strdup(
                "a write drops this line: by all that is left, the user's addition was cut off "
                "before there was a line in the shadow file, and can be made again"));
    else if (lacks_shadow_line)
        add(gravity::LOSS, "no-shadow-line", ROW, line,
            g_strdup("a write drops the user: its password is in the shadow file, which has no "
                     "line of it"));
    else if (group_database_find_gid(&ctx_->group_db, line.primary_group) == nullptr)
        add(gravity::LOSS, "no-primary-group", ROW, line,
            g_strdup_printf("a write drops the user: no group that is kept has its GID %u",
                            line.primary_group));
    else if (user_type_of_uid(line.id) == 0)
        add(gravity::LOSS, "uid-out-of-range", ROW, line,
            g_strdup_printf("a write drops the user: the UID %u is in no range of this device",
                            line.id));
    else
        add(gravity::LOSS, "dropped", ROW, line, g_strdup("a write drops the user"));
}

void line_review::explain_lost_group(const account_line &line) {
    if (group_type_of_gid(line.id) == 0)
        add(gravity::LOSS, "gid-out-of-range", CORE_FILE_ROW_GROUP, line,
            g_strdup_printf("a write drops the group: the GID %u is in no range of this device",
                            line.id));
    else
        add(gravity::LOSS, "repeated-group", CORE_FILE_ROW_GROUP, line,
            g_strdup("a write drops this line: the group stands in an earlier one"));
}

static bool is_of(const account_line &line, const internal_user *user) {
    return g_strcmp0(line.name, user->name) == 0 && line.id == user->uid &&
           line.primary_group == user->gid;
}

static bool is_of(const account_line &line, const internal_group *group) {
    return g_strcmp0(line.name, group->name) == 0 && line.id == group->gid;
}

// What is loaded is a part of the entries, in their order.
template <typename record>
static const record *next_if(const GPtrArray *loaded, guint *at, const account_line &line) {
    if (*at >= loaded->len)
        return nullptr;
    const auto *found = static_cast<const record *>(loaded->pdata[*at]);
    if (!is_of(line, found))
        return nullptr;
    (*at)++;
    return found;
}

void line_review::review_passwd() {
    guint at = 0;

    for (const account_line *line : lines_of(files_[CORE_FILE_ROW_PASSWD])) {
        if (!line->is_entry)
            continue;
        (void)add_name(users_, line->name);  // It may stand twice.
        const auto *user = next_if<internal_user>(ctx_->user_db.entries, &at, *line);
        if (user == nullptr) {
            explain_lost_user(*line);
            continue;
        }
        if (user->shadowed) {
            (void)g_hash_table_insert(shadowed_, user->name, const_cast<internal_user *>(user));
            count_one(due_, user->name);
        }
        compare(CORE_FILE_ROW_PASSWD, *line, user);
        review_hash(CORE_FILE_ROW_PASSWD, *line);
    }
}

void line_review::review_shadow() {
    static constexpr int ROW = CORE_FILE_ROW_SHADOW;
    g_autoptr(GHashTable) seen = name_table_new();

    for (const account_line *line : lines_of(files_[ROW])) {
        if (!line->is_entry)
            continue;
        const bool is_first = add_name(seen, line->name);
        if (take_one(due_, line->name)) {
            g_ptr_array_add(kept_, line->name);
            compare(ROW, *line, g_hash_table_lookup(shadowed_, line->name));
            review_hash(ROW, *line);
        } else if (!is_first) {
            add(gravity::CHANGE, "repeated-shadow-line", ROW, *line,
                g_strdup("a write drops this line: the user stands in an earlier one, which "
                         "counts"));
        } else if (!has_name(users_, line->name)) {
            add(gravity::CHANGE, "no-passwd-line", ROW, *line,
                g_strdup("a write drops this line: no user has this name"));
        } else if (user_database_find(&ctx_->user_db, line->name) != nullptr) {
            add(gravity::CHANGE, "unused-shadow-line", ROW, *line,
                g_strdup("a write drops this line: the user's password stands in passwd"));
        }
    }
}

// Each user of a name that stands twice is written with a line of its own.
void line_review::review_added_shadow_lines() {
    for (const internal_user *user : records<const internal_user>(ctx_->user_db.entries))
        if (user->shadowed && take_one(due_, user->name))
            out_->add(gravity::CHANGE, "added-shadow-line",
                      core_file_table[CORE_FILE_ROW_SHADOW].path, 0, user->name,
                      g_strdup("a write adds a line of the user, whose name stands twice in "
                               "passwd"));
}

// The lines of the shadow file follow those of passwd once they are written.
void line_review::review_order() {
    g_autoptr(GHashTable) counts = name_table_new();
    guint at = 0;
    bool is_same = true;

    for (const char *name : records<const char>(kept_))
        count_one(counts, name);
    for (const internal_user *user : records<const internal_user>(ctx_->user_db.entries))
        if (user->shadowed && take_one(counts, user->name))
            is_same = is_same && g_str_equal(kept_->pdata[at++], user->name);
    if (!is_same)
        out_->add(gravity::CHANGE, "order", core_file_table[CORE_FILE_ROW_SHADOW].path, 0, nullptr,
                  g_strdup("its lines stand in another order than those of passwd, which a write "
                           "gives them"));
}

void line_review::review_members(const account_line &line) {
    for (const char *member : records<const char>(line.members))
        if (!has_name(users_, member))
            add(gravity::NOTICE, "unknown-member", CORE_FILE_ROW_GROUP, line,
                g_strdup_printf("lists \"%s\", who has no account: an account of that name would "
                                "be a member, and the group cannot be removed",
                                member));
}

void line_review::review_groups() {
    guint at = 0;

    for (const account_line *line : lines_of(files_[CORE_FILE_ROW_GROUP])) {
        if (!line->is_entry)
            continue;
        const auto *group = next_if<internal_group>(ctx_->group_db.entries, &at, *line);
        if (group == nullptr) {
            explain_lost_group(*line);
            continue;
        }
        compare(CORE_FILE_ROW_GROUP, *line, group);
        review_members(*line);
    }
}

void line_review::review_hash(int row, const account_line &line) {
    const std::string_view hash = line.field(PASSWORD);
    const bool is_known = find_hash_cost(hash).work != hash_work::UNKNOWN;
    char *fault = describe_hash(hash);

    if (fault != nullptr)
        add(gravity::NOTICE, is_known ? "costly-hash" : "unknown-hash", row, line, fault);
}

void line_review::review_root() {
    const internal_user *root = user_database_find(&ctx_->user_db, "root");

    if (root == nullptr || root->uid != 0)
        out_->add(gravity::NOTICE, "no-root", core_file_table[CORE_FILE_ROW_PASSWD].path, 0, "root",
                  g_strdup("no user that is kept has the name root and the UID 0"));
}

void line_review::run() {
    for (const account_line *line : lines_of(files_[CORE_FILE_ROW_SHADOW]))
        if (line->is_entry)
            (void)add_name(shadow_names_, line->name);  // It may stand twice.
    for (int row = 0; row < CORE_FILE_COUNT; row++)
        review_others(row);
    review_passwd();
    review_shadow();
    review_added_shadow_lines();
    review_order();
    review_groups();
    review_repeated_lines(files_, out_);
    review_root();
}

void review_lines(const account_file (&files)[CORE_FILE_COUNT], const usermgmt_ctx *ctx,
                  findings *out) {
    line_review(files, ctx, out).run();
}
