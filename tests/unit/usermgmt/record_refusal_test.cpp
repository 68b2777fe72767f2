// tests/unit/usermgmt/record_refusal_test.cpp: what would come back as another record can be
// neither added nor made by a modification.
#include <random>

#include "tests/unit/usermgmt/changed_accounts.h"

class RecordRefusal : public ChangedAccounts {
  protected:
    static entry_fields named(const char *name) {
        return {.type = USER_TYPE_DYNAMIC_SYSTEM, .name = name, .group = "users"};
    }
    static std::string failed_add(const char *name, const char *file, int index) {
        return "corefile 101: Failed to add user '" + std::string(name) +
               "', unable to sync core files, failed to write 1/3 core file(s) " + file +
               ": could not write entry #" + std::to_string(index) + " to etc/" + file +
               ".tmp: Invalid argument";
    }
};

TEST_F(RecordRefusal, NamesThatCannotBeAdded) {
    EXPECT_EQ(add(named(" root")),
              "corefile 101: Failed to add user ' root', unable to sync core files, failed to "
              "write 1/3 core file(s) passwd: could not write entry #8 to etc/passwd.tmp: Invalid "
              "argument");
    struct name_case {
        const char *name;
        const char *file;
        int index;
    };
    static constexpr name_case cases[] = {
        {"\troot", "passwd", 8},
        {"+x",     "passwd", 8},
        {"-x",     "passwd", 8},
        {"#x",     "passwd", 8},
        {"a:b",    "passwd", 8},
        {"a\nb",   "passwd", 8},
        {" ",      "passwd", 8},
        {"a,b",    "group",  4},
        {"",       "group",  4},
    };
    for (const name_case &row : cases) {
        EXPECT_EQ(add(named(row.name)), failed_add(row.name, row.file, row.index));
        expect_nothing_changed();
    }
}

// The index is that of the first group that would list the name, in the order of the file.
TEST_F(RecordRefusal, IndexOfTheFirstGroup) {
    entry_fields entry = named("a,b");
    entry.group = "nogroup";
    EXPECT_EQ(add(entry), failed_add("a,b", "group", 7));
    entry.groups = {"camera", "audio"};
    EXPECT_EQ(add(entry), failed_add("a,b", "group", 3));
    entry.group = "root";
    EXPECT_EQ(add(entry), failed_add("a,b", "group", 0));
    expect_nothing_changed();
}

TEST_F(RecordRefusal, RefusedAddTouchesNoFile) {
    io_trace trace;
    EXPECT_NE(add(named(" root")), "");
    EXPECT_NE(add(named("a,b")), "");
    EXPECT_EQ(trace.calls(), lines());
}

TEST_F(RecordRefusal, NamesThatSurvive) {
    for (const char *name : {"root ", "a b", "\xff", "x.y-z_", "a#b", "a+", "host$"}) {
        EXPECT_EQ(add(named(name)), "") << name;
        expect_memory_on_disk();
        EXPECT_TRUE(usermgmt_user_exists(ctx_.get(), name)) << name;
    }
    EXPECT_EQ(read("shadow").rfind("root:$6$rootsalt$roothash:", 0), 0U);
}

TEST_F(RecordRefusal, CommentIsStoredWithBlanks) {
    entry_fields entry = named("svc");
    entry.gecos = "a:b\nroot:x";
    EXPECT_EQ(add(entry), "");
    EXPECT_EQ(read("passwd"), PASSWD + "svc:x:989:100:a b root x::/bin/false\n");
    expect_memory_on_disk();
}

TEST_F(RecordRefusal, ShellsOfNewUsers) {
    for (const char *shell : {"/bin/sh:", "/bin/s\nh", "\n", ":/bin/sh:0"}) {
        entry_fields entry = named("svc");
        entry.shell = shell;
        EXPECT_EQ(add(entry), failed_add("svc", "passwd", 8));
        expect_nothing_changed();
    }
}

// The password's hash would have ended on root's line.
TEST_F(RecordRefusal, RootKeepsItsHash) {
    entry_fields entry = named(" root");
    entry.password = "attack";
    EXPECT_NE(add(entry), "");
    reopen();
    EXPECT_EQ(modify("alice", {.gecos = "another write"}), "");
    EXPECT_EQ(read("shadow"), SHADOW);
    EXPECT_EQ(read("passwd"), edited(PASSWD, ":Alice:", ":another write:"));
}

// The cause is the write's own where it fails.
TEST_F(RecordRefusal, HashInMemoryThatCannotBeWritten) {
    g_free(user("alice")->password);
    user("alice")->password = g_strdup("a:b");
    remember();
    for (const entry_fields &fields : {entry_fields{.gecos = "x"}, entry_fields{.password = "x"},
                                       entry_fields{.groups = {{"camera"}}}}) {
        EXPECT_EQ(modify("alice", fields),
                  "corefile 101: Failed to modify user 'alice', unable to sync core files, failed "
                  "to write 1/3 core file(s) shadow: could not write entry #5 to etc/shadow.tmp: "
                  "Invalid argument");
        expect_nothing_changed();
    }
}

static std::string nasty_text(std::mt19937 *random, int longest) {
    static const lines pieces = {" ",        "\t",   "\r",   "\n",    ":",  ",", "+",  "-",
                                 "#",        "*",    "!",    "x",     "0",  "$", "/",  ".",
                                 "@",        "%s",   "root", "alice", "\\", "'", "\"", "\xff",
                                 "\xc3\xa4", "\x01", "\x7f", "a",     "b",  ""};
    std::string text;
    const int size = std::uniform_int_distribution<int>(0, longest)(*random);
    for (int i = 0; i < size; i++)
        text += pieces[std::uniform_int_distribution<std::size_t>(0, pieces.size() - 1)(*random)];
    return text;
}

// Either nothing changes, or what is in memory is what comes back.
TEST_F(RecordRefusal, AnyAddIsRefusedOrComesBack) {
    std::mt19937 random(7);
    int added = 0;
    int refusals = 0;
    const std::string root_line = SHADOW.substr(0, SHADOW.find('\n') + 1);
    for (int i = 0; i < 300; i++) {
        write("passwd", PASSWD);
        write("shadow", SHADOW);
        write("group", GROUP);
        reopen();
        const std::string name = nasty_text(&random, 4);
        const std::string shell = nasty_text(&random, 3);
        const std::string gecos = nasty_text(&random, 4);
        SCOPED_TRACE("name '" + name + "' shell '" + shell + "' gecos '" + gecos + "'");
        entry_fields entry = named(name.c_str());
        entry.groups = {"video", "root"};
        entry.gecos = gecos.c_str();
        entry.shell = shell.c_str();
        if (!add(entry).empty()) {
            refusals++;
            expect_nothing_changed();
            continue;
        }
        added++;
        expect_memory_on_disk();
        EXPECT_TRUE(usermgmt_user_exists(ctx_.get(), name.c_str()));
        EXPECT_EQ(read("shadow").rfind(root_line, 0), 0U);
        const std::string passwd = read("passwd");
        const std::string shadow = read("shadow");
        EXPECT_EQ(modify("bob", {.groups = {{"video"}}, .gecos = "again"}), "");
        EXPECT_EQ(read("passwd"), edited(passwd, "bob:x:1005:100::", "bob:x:1005:100:again:"));
        EXPECT_EQ(read("shadow"), shadow);
        expect_memory_on_disk();
    }
    EXPECT_GT(added, 30);
    EXPECT_GT(refusals, 30);
}

TEST_F(RecordRefusal, AnyModificationIsRefusedOrComesBack) {
    std::mt19937 random(8);
    int modified = 0;
    int refusals = 0;
    for (int i = 0; i < 200; i++) {
        const std::string shell = nasty_text(&random, 3);
        const std::string gecos = nasty_text(&random, 4);
        SCOPED_TRACE("shell '" + shell + "' gecos '" + gecos + "'");
        remember();
        if (modify("camd", {.gecos = gecos.c_str(), .shell = shell.c_str()}).empty()) {
            modified++;
            expect_memory_on_disk();
        } else {
            refusals++;
            expect_nothing_changed();
        }
    }
    EXPECT_GT(modified, 30);
    EXPECT_GT(refusals, 10);
}
