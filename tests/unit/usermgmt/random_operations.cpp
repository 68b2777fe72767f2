// tests/unit/usermgmt/random_operations.cpp: account files and changes by chance, the same for the
// same seed.
#include "tests/unit/usermgmt/random_operations.h"

#include <iterator>

#include "tests/unit/usermgmt/account_files.h"
#include "usermgmt/usermgmt.h"

// The first line of each pool is always there: without its group, root would be dropped.
static const std::vector<const char *> passwd_pool = {
    "root:x:0:0:root:/root:/bin/sh\n",
    "daemon:x:1:1:daemon:/usr/sbin:/bin/false\n",
    "# a comment\n",
    "anonymous:x:100:100:Visitor:/:/bin/false\n",
    "guest:x:101:100:::/bin/false\n",
    "camd:x:990:995:Camera:/var/lib/camd:/bin/false\n",
    "plain:$5$plain$hash:985:100:Plain, as in old files::\n",
    "alice:x:1000:100:Alice:/home/alice:/bin/false\n",
    "bob:x:1005:100:::/bin/false\n",
    "\n",
    "old:x:1010:44:Never changed::/bin/false\n",
    "lost:x:1020:4242:No group:/:/bin/false\n",
    "far:x:61000:100:No type:/:/bin/false\n",
    "bare:x:1030:100:No shadow line:/:/bin/false\n",
    "malformed:x\n",
    "last:x:60000:100:Last of its range::\n",
    "nobody:*:65534:65534:nobody:/:/bin/false\n",
};
static const std::vector<const char *> shadow_pool = {
    "root:$6$rootsalt$roothash:19000:0:99999:7:0::\n",
    "daemon:*:19001:0:99999:7:0::\n",
    "anonymous:!:19002:0:99999:7:0::\n",
    "# a comment\n",
    "guest:$1$saltsalt$hash:19003:0:99999:7:0::\n",
    "camd:$5$ZZZZZZZZZZZZ$hash:19004:0:99999:7:0::\n",
    "alice:$5$abcdefghijkl$hash:19005:10:90:7:::\n",
    "alice:$5$second$line:1:0:99999:7:0::\n",
    "bob:$5$0123456789ab$hash:19006:0:99999:7:0::\n",
    "old:*::0:99999:7:0::\n",
    "last::40000:0:99999:7:0::\n",
};
static const std::vector<const char *> group_pool = {
    "root:x:0:\n",
    "daemon:x:1:\n",
    "video:x:44:alice\n",
    "audio:x:45:alice,bob\n",
    "# a comment\n",
    "users:x:100:alice,bob\n",
    "video:x:46:guest\n",
    "camera:!:995:camd\n",
    "people:x:5000:alice\n",
    "ghosts::999:nosuch,alice\n",
    "nvr:x:60005:\n",
    "malformed:x\n",
    "nvr2:x:60006:camd,guest\n",
    "nogroup:x:65534:\n",
};

// Known accounts come more often than others, so that most operations meet one.
static constexpr const char *known_users[] = {"root",  "anonymous", "guest", "camd",   "plain",
                                              "alice", "bob",       "old",   "nobody", "last"};
static constexpr const char *new_users[] = {"dave", "erin", "svc", "svc2", "nosuch", "Z9"};
static const std::string hostile_names[] = {
    "",
    " root",
    "root ",
    "\troot",
    "+",
    "+x",
    "-x",
    "-",
    "#x",
    "a,b",
    "a:b",
    "a\nb",
    "root\n",
    "a b",
    "\n",
    "*",
    "x\r",
    "\xc3\xa4",
    "\xff",
    "a/../b",
    "%s%n",
    "$x",
    ".",
    "x:0:0:",
    "bob\n",
    "\v",
    "x ",
    "dave,",
    ",dave",
    "\a",
    "x\t",
    "\x7f",
    "0",
    "+root",
    "fifteenletters1",
    std::string(300, 'n'),
};
static constexpr const char *known_groups[] = {"root",   "daemon", "video",  "audio", "users",
                                               "camera", "nvr",    "ghosts", "nvr2",  "nogroup"};
static constexpr const char *new_groups[] = {"sound", "web_admins", "a.b-c", "host$", "x@y"};
static constexpr const char *passwords_may_go[] = {"anonymous", "guest", "camd", "plain", "svc"};
static constexpr const char *groups_may_go[] = {"camera", "nvr", "nvr2", "ghosts", "sound", "x@y"};
static const std::string hostile_comments[] = {
    "",
    ":",
    "a:b",
    "x\ny",
    ":::::",
    "\n",
    "a:x:0:0::/:/bin/sh\nroot2:x:0:0:",
    "\r\n",
    " x ",
    "\xff",
    "%s%n",
    "a,b,c",
    "#",
    "\xc3\xa4",
    std::string(3000, 'c'),
};
static const std::string hostile_shells[] = {
    "",
    "/bin/sh:",
    "/bin/sh\n",
    "a\nroot2:x:0:0:::",
    " ",
    " /bin/sh",
    "/bin/sh ",
    "\n",
    ":",
    "\xff",
    "#",
    "\r",
    "*",
    "%n",
    std::string(2000, 's'),
};
static const std::string passwords[] = {
    "a",
    "secret",
    "p:q\nr",
    "\xff\xfe",
    "*",
    "!",
    std::string(64, 'p'),
    std::string(65, 'p'),
    std::string(511, 'p'),
    std::string(512, 'p'),
    "",
};

template <typename array>
static std::string one_of(random_operations *chance, const array &choices) {
    return std::string(choices[chance->below(static_cast<unsigned>(std::size(choices)))]);
}

std::string random_operations::line_pool(const std::vector<const char *> &pool) {
    std::string text = pool[0];
    for (std::size_t i = 1; i < pool.size(); i++)
        if (!once_in(4))
            text += pool[i];
    if (once_in(16))
        text.pop_back();  // a last line without its end
    return text;
}

starting_files random_operations::next_files() {
    static constexpr unsigned modes[] = {0644, 0600, 0640, 0664, 0604, 0400};
    starting_files files = {};
    files.texts[CORE_FILE_ROW_PASSWD] = line_pool(passwd_pool);
    files.texts[CORE_FILE_ROW_SHADOW] = line_pool(shadow_pool);
    files.texts[CORE_FILE_ROW_GROUP] = line_pool(group_pool);
    for (unsigned &mode : files.modes)
        mode = modes[below(std::size(modes))];
    files.has_shadow = !once_in(40);
    files.open_flags = once_in(4) ? guint32{USERMGMT_OPEN_NO_CACHE} : 0;
    return files;
}

std::string random_operations::user_name() {
    if (once_in(4))
        return one_of(this, hostile_names);
    return once_in(2) ? one_of(this, new_users) : one_of(this, known_users);
}

std::string random_operations::group_name() {
    if (once_in(24))
        return one_of(this, hostile_names);
    return once_in(5) ? one_of(this, new_groups) : one_of(this, known_groups);
}

std::vector<std::string> random_operations::group_names() {
    std::vector<std::string> names(below(4));
    for (std::string &name : names)
        name = group_name();
    return names;
}

optional_text random_operations::comment() {
    if (once_in(3))
        return std::nullopt;
    return once_in(2) ? one_of(this, hostile_comments) : "Comment " + std::to_string(below(3));
}

optional_text random_operations::shell() {
    if (!once_in(3))
        return std::nullopt;
    return once_in(3) ? one_of(this, hostile_shells) : "/bin/sh";
}

optional_text random_operations::password() {
    if (once_in(2))
        return std::nullopt;
    return once_in(2) ? one_of(this, passwords) : "secret";
}

void random_operations::fill_new_user(operation *what) {
    static constexpr gint32 uids[] = {1000, 1001,  5000, 60000, 999,       60001,
                                      0,    65534, -2,   1,     G_MININT32};
    what->type = once_in(8)
                     ? below(8)
                     : (once_in(2) ? guint32{USER_TYPE_DYNAMIC_SYSTEM} : guint32{USER_TYPE_ORNET});
    what->name = what->account;
    if (once_in(24))
        what->name = once_in(2) ? optional_text() : user_name();
    what->group = once_in(24) ? optional_text() : group_name();
    if (!once_in(3))
        what->names = group_names();
    what->gecos = comment();
    if (what->type != USER_TYPE_ORNET || once_in(8))
        what->shell = shell();
    what->password = what->type == USER_TYPE_ORNET && !once_in(8) ? "secret" : password();
    if (once_in(what->type == USER_TYPE_ORNET ? 3 : 16))
        what->uid = uids[below(std::size(uids))];
}

void random_operations::fill_modification(operation *what) {
    if (once_in(12))
        what->name = once_in(2) ? what->account : user_name();
    if (once_in(24))
        what->type = below(8);
    if (once_in(3))
        what->group = group_name();
    if (once_in(3) || what->account == "anonymous")
        what->names = group_names();
    if (once_in(2))
        what->gecos = comment();
    if (once_in(3))
        what->shell = shell();
    what->password = password();
    if (once_in(8))
        what->uid = 0;  // never looked at
    if (what->account == "root" && !once_in(3))
        *what = {.kind = what->kind, .account = what->account, .password = "new"};
}

// Every step of a write, on a file by chance; some are never reached.
planned_fault random_operations::fault(bool of_groups) {
    struct step {
        const char *call;
        bool on_temporary;
        int nth;
    };
    static constexpr step steps[] = {
        {"stat",   false, 2},
        {"unlink", true,  1},
        {"open",   true,  1},
        {"fdopen", true,  1},
        {"fchmod", true,  1},
        {"put",    true,  1},
        {"put",    true,  3},
        {"fflush", true,  1},
        {"fchmod", true,  2},
        {"fsync",  true,  1},
        {"fclose", true,  1},
        {"rename", true,  1},
        {"rename", true,  1},
    };
    static constexpr const char *puts[] = {"putpwent", "putspent", "putgrent"};
    if (once_in(10))
        return {"fsync", "etc", 1 + static_cast<int>(below(3)), CORE_FILE_COUNT};
    const step &chosen = steps[below(std::size(steps))];
    const int row = of_groups ? int{CORE_FILE_ROW_GROUP} : static_cast<int>(below(CORE_FILE_COUNT));
    const std::string call = chosen.call == std::string("put") ? puts[row] : chosen.call;
    return {call, core_file_table[row].path + std::string(chosen.on_temporary ? ".tmp" : ""),
            chosen.nth, call == "rename" ? row : 0};
}

operation random_operations::next_operation(bool with_fault) {
    // Not evenly: most of them change a user.
    static constexpr operation_kind kinds[] = {
        operation_kind::add_user,         operation_kind::add_user,    operation_kind::add_user,
        operation_kind::modify_user,      operation_kind::modify_user, operation_kind::modify_user,
        operation_kind::modify_user,      operation_kind::delete_user, operation_kind::delete_user,
        operation_kind::disable_password, operation_kind::add_group,   operation_kind::delete_group,
        operation_kind::reopen,
    };
    operation what = {.kind = kinds[below(std::size(kinds))]};
    const bool on_group =
        what.kind == operation_kind::add_group || what.kind == operation_kind::delete_group;
    what.account = on_group ? group_name() : user_name();
    if (what.kind == operation_kind::disable_password && !once_in(4)) {
        what.account = one_of(this, passwords_may_go);
    } else if (what.kind == operation_kind::delete_group && !once_in(4)) {
        what.account = one_of(this, groups_may_go);
    } else if (what.kind == operation_kind::add_group) {
        what.account = once_in(2) ? one_of(this, hostile_names) : one_of(this, new_groups);
        what.names = std::vector<std::string>(below(3));
        for (std::string &name : *what.names)
            name = once_in(8) ? user_name() : one_of(this, known_users);
    } else if (what.kind == operation_kind::add_user) {
        what.account = once_in(3) ? user_name() : one_of(this, new_users);
        fill_new_user(&what);
    } else if (what.kind == operation_kind::modify_user) {
        fill_modification(&what);
    }
    if (once_in(200))
        what.account.reset();
    what.seconds_later = below(2 * 86400);
    if (with_fault && once_in(4))
        what.fault = fault(on_group);
    return what;
}

static std::string shown(const optional_text &text) {
    if (!text)
        return "none";
    g_autofree char *escaped = g_strescape(text->substr(0, 60).c_str(), nullptr);
    return std::string("\"") + escaped + (text->size() > 60 ? "\"..." : "\"");
}

std::string described(const operation &what) {
    static constexpr const char *kinds[OPERATION_KINDS] = {
        "add user",  "modify user",  "delete user", "disable password",
        "add group", "delete group", "reopen"};
    std::string text = kinds[static_cast<int>(what.kind)];
    text += " " + shown(what.account) + ": type " + std::to_string(what.type) + " name " +
            shown(what.name) + " password " + shown(what.password) + " group " + shown(what.group) +
            " names";
    if (!what.names)
        text += " none";
    else
        for (const std::string &name : *what.names)
            text += " " + shown(name);
    text += " gecos " + shown(what.gecos) + " shell " + shown(what.shell) + " uid " +
            std::to_string(what.uid);
    if (what.fault)
        text += ", with call " + std::to_string(what.fault->nth) + " of " + what.fault->call + " " +
                what.fault->path + " failing";
    return text;
}
