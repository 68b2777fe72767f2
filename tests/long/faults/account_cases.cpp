// tests/long/faults/account_cases.cpp: the account operations that are struck, and the files that
// they start from.
#include "tests/long/faults/account_cases.h"

#include <sys/stat.h>
#include <unistd.h>

#include "tests/unit/usermgmt/operation_call.h"

// Day 20000, as the number of seconds.
static constexpr gint64 START = gint64{20000} * 86400 + 4000;

static const std::string passwd_text =
    "root:x:0:0:root:/root:/bin/sh\n"
    "daemon:x:1:1:daemon:/usr/sbin:/bin/false\n"
    "anonymous:x:100:100:Visitor:/:/bin/false\n"
    "guest:x:101:100:" +
    std::string(5000, 'g') +
    "::/bin/false\n"
    "camd:x:990:995:Camera:/var/lib/camd:/bin/false\n"
    "plain:$5$plain$hash:985:100:Plain, as in old files::\n"
    "alice:x:1000:100:Alice:/home/alice:/bin/false\n"
    "bob:x:1005:100:::/bin/false\n"
    "nobody:*:65534:65534:nobody:/:/bin/false\n";
static const std::string shadow_text =
    "root:$6$rootsalt$roothash:19000:0:99999:7:0::\n"
    "daemon:*:19001:0:99999:7:0::\n"
    "anonymous:!:19002:0:99999:7:0::\n"
    "guest:$1$saltsalt$hash:19003:0:99999:7:0::\n"
    "camd:$5$ZZZZZZZZZZZZ$hash:19004:0:99999:7:0::\n"
    "alice:$5$abcdefghijkl$hash:19005:0:99999:7:0::\n"
    "bob:$5$0123456789ab$hash:19006:0:99999:7:0::\n";
static const std::string group_text =
    "root:x:0:\n"
    "daemon:x:1:\n"
    "video:x:44:alice\n"
    "audio:x:45:alice,bob\n"
    "users:x:100:alice,bob\n"
    "camera:x:995:camd\n"
    "nvr:x:60005:\n"
    "nogroup:x:65534:\n";

using kind = operation_kind;
static const account_case cases[] = {
    {"add user",
     {.kind = kind::add_user,
      .account = "svc",
      .type = USER_TYPE_DYNAMIC_SYSTEM,
      .name = "svc",
      .group = "users",
      .names = {{"video"}}}                                                                      },
    {"add user with a UID",
     {.kind = kind::add_user,
      .account = "web1",
      .type = USER_TYPE_ORNET,
      .name = "web1",
      .password = "secret",
      .group = "users",
      .gecos = "Web",
      .uid = 5000}                                                                               },
    {"modify comment",
     {.kind = kind::modify_user, .account = "camd", .gecos = "New", .shell = "/bin/sh"}          },
    {"modify password",         {.kind = kind::modify_user, .account = "camd", .password = "new"}},
    {"modify primary group",    {.kind = kind::modify_user, .account = "camd", .group = "users"} },
    {"modify secondary groups",
     {.kind = kind::modify_user, .account = "alice", .names = {{"audio", "nvr"}}}                },
    {"modify everything",
     {.kind = kind::modify_user,
      .account = "camd",
      .password = "new",
      .group = "users",
      .names = {{"audio"}},
      .gecos = "New",
      .shell = "/bin/sh"}                                                                        },
    {"modify root's password",  {.kind = kind::modify_user, .account = "root", .password = "new"}},
    {"rename user",
     {.kind = kind::modify_user, .account = "camd", .name = "cam2", .gecos = "New"},
     "usermgmt 17: "},
    {"delete user",                         {.kind = kind::delete_user, .account = "alice"}                                                                             },
    {"disable password",                         {.kind = kind::disable_password, .account = "camd"}},
    {"disable password in the passwd file",                         {.kind = kind::disable_password, .account = "plain"}                                                          },
    {"add group",                         {.kind = kind::add_group, .account = "sound", .names = {{"alice"}}}                     },
    {"delete group",                         {.kind = kind::delete_group, .account = "nvr"}                                                       },
};

std::span<const account_case> account_cases() {
    return cases;
}

const operation &later_operation() {
    static const operation later = {.kind = kind::add_user,
                                    .account = "later",
                                    .type = USER_TYPE_DYNAMIC_SYSTEM,
                                    .name = "later",
                                    .group = "root"};
    return later;
}

// Three modes, so that none is taken for another.
folder_state typical_accounts() {
    return {
        {"passwd", plain_file(passwd_text, 0644)},
        {"shadow", plain_file(shadow_text, 0640)},
        {"group",  plain_file(group_text,  0664)}
    };
}

folder_state untidy_accounts() {
    folder_state files = typical_accounts();
    files["passwd"].text += "# a comment\nmalformed:x\nlost:x:1020:4242:No group:/:/bin/false\n";
    files["shadow"].text +=
        "root::1:0:99999:7:0::\n"
        "alice:$5$second$line:1:10:90:7:::\n"
        "gone:$5$no$user:19000:0:99999:7:0::\n";
    files["group"].text += "video:x:46:guest\npeople:x:5000:alice\nghosts::999:nosuch,alice";
    return files;
}

const std::vector<std::string> &account_file_names() {
    static const std::vector<std::string> names = {"passwd", "shadow", "group"};
    return names;
}

static folder_state temporaries_like(const lying_file &file) {
    folder_state files;
    for (const std::string &name : account_file_names())
        files[name + ".tmp"] = file;
    return files;
}

// Nobody's, where this process may give files away.
static lying_file foreign_file() {
    lying_file file = plain_file("root::0:0:::/bin/sh\n", 04666);
    if (geteuid() == 0) {
        file.owner = 65534;
        file.group = 65534;
    }
    return file;
}

std::vector<leftover> leftovers() {
    lying_file link = plain_file("../outside", 0777);
    link.mode = S_IFLNK | 0777;
    lying_file dangling = link;
    dangling.text = "../nowhere";
    return {
        {"own leftovers", temporaries_like(plain_file("root:x:0:0:ro", 0600))},
        {"foreign leftovers",               temporaries_like(foreign_file())                                       },
        {"links as leftovers",               temporaries_like(link)},
        {"dangling links as leftovers",               temporaries_like(dangling)                              },
    };
}

folder_state random_accounts(const starting_files &files) {
    folder_state state;
    for (int row = 0; row < CORE_FILE_COUNT; row++)
        if (row != CORE_FILE_ROW_SHADOW || files.has_shadow)
            state[core_file_table[row].name] = plain_file(files.texts[row], files.modes[row]);
    return state;
}

context_slot open_accounts(guint32 flags) {
    context_slot slot;
    error_slot error;
    (void)take_syslog();
    slot.ctx.reset(usermgmt_open(flags | USERMGMT_OPEN_TRYLOCK, error.out()));
    slot.error = error.text();
    slot.log = take_syslog();
    return slot;
}

account_runner::account_runner() {
    sources_.stand_in = cheap_hash;
    sources_.random = "0123456789";
    set_time(START);
}

// Salts begin with what these three add up to: nothing, every time.
void account_runner::set_time(gint64 now) {
    sources_.now = now;
    sources_.pid = static_cast<pid_t>(-now);
    sources_.ticks = 0;
}

operation_result account_runner::run(usermgmt_ctx *ctx, const operation &what, call_trace *trace,
                                     const trap_plan &plan) {
    error_slot error;
    operation_result result = {};
    sources_.hashes.clear();
    sources_.settings.clear();
    sources_.reads.clear();
    warnings_.clear();
    (void)take_syslog();

    GError **slot = error.out();
    if (trace != nullptr)
        begin_trap(trace, plan);
    result.succeeded = call_operation(ctx, what, &warnings_, slot);
    end_trap();
    result.error = error.text();
    result.new_hash = sources_.hashes.empty() ? "" : sources_.hashes.back();
    result.now = *sources_.now;
    return result;
}

bool is_answer(const char *expected, const operation_result &result) {
    if (*expected == '\0')
        return result.succeeded;
    return !result.succeeded && result.error.starts_with(expected);
}

std::string difference_from_disk(const account_model &model) {
    for (int row = 0; row < CORE_FILE_COUNT; row++) {
        const std::string text = read_account_text(row);
        if (text != model.disk().texts[row])
            return std::string(core_file_table[row].name) +
                   " is not what it has to be:" + line_difference(model.disk().texts[row], text);
    }
    return "";
}
