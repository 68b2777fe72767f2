// benchmarks/floor/load_floor.cpp: what loading the accounts costs at the very least: each line of
// the three files read by the C library and kept, beside them a record of each user with strings of
// its own, an index of their names with keys of its own, and of each group the set of its members.
// Nothing is checked, and nothing is logged.
//
//   load_floor FOLDER
//
// FOLDER holds passwd, shadow and group, the second in the order of the first. Prints the
// microseconds of it all.
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <ctime>
#include <initializer_list>
#include <string>
#include <vector>

#include <grp.h>
#include <pwd.h>
#include <shadow.h>

#include <glib.h>

// Of the longest line: a group that lists each of 59,001 users.
static constexpr std::size_t LINE_ROOM = 4 * 1024 * 1024;

// The database's record of a user, beside its strings.
struct user {
    guint32 type, shadowed, uid, gid;
    gint64 last_change;
    char *password;
    char *texts[4];
};

struct lines {
    std::vector<struct passwd *> users;
    std::vector<struct spwd *> shadows;
    std::vector<char **> members;
};

static void require(bool holds, const char *what) {
    if (holds)
        return;
    (void)fprintf(stderr, "load_floor: %s: %s\n", what, strerror(errno));
    exit(EXIT_FAILURE);
}

// A record with these of its strings behind it, in one block.
template <typename record>
static record *keep(const record &line, std::initializer_list<char * record::*> texts) {
    std::size_t size = sizeof(record);
    for (char *record::*text : texts)
        size += strlen(line.*text) + 1;
    auto *kept = static_cast<record *>(g_malloc(size));
    *kept = line;
    char *room = reinterpret_cast<char *>(kept + 1);
    for (char *record::*text : texts) {
        kept->*text = room;
        room = stpcpy(room, line.*text) + 1;
    }
    return kept;
}

static char **keep_list(char *const *names) {
    std::size_t count = 0;
    std::size_t size = sizeof *names;
    for (; names[count] != nullptr; count++)
        size += sizeof *names + strlen(names[count]) + 1;
    auto **kept = static_cast<char **>(g_malloc(size));
    char *room = reinterpret_cast<char *>(kept + count + 1);
    for (std::size_t i = 0; i < count; i++) {
        kept[i] = room;
        room = stpcpy(room, names[i]) + 1;
    }
    kept[count] = nullptr;
    return kept;
}

// Calls take for each line of a file.
template <typename record, typename taker>
static void read_file(const std::string &path,
                      int (*reader)(FILE *, record *, char *, std::size_t, record **), taker take) {
    g_autofree auto *room = static_cast<char *>(g_malloc(LINE_ROOM));
    FILE *stream = fopen(path.c_str(), "re");
    require(stream != nullptr && fseek(stream, 0, SEEK_SET) == 0, path.c_str());
    record line;
    record *result = nullptr;
    int status = 0;
    while ((status = reader(stream, &line, room, LINE_ROOM, &result)) == 0)
        take(line);
    require(status == ENOENT, path.c_str());
    (void)fclose(stream);
}

static lines read_lines(const std::string &folder) {
    lines all;
    read_file<struct passwd>(folder + "/passwd", fgetpwent_r, [&all](const struct passwd &line) {
        all.users.push_back(keep(line, {&passwd::pw_name, &passwd::pw_passwd, &passwd::pw_gecos,
                                        &passwd::pw_dir, &passwd::pw_shell}));
    });
    read_file<struct spwd>(folder + "/shadow", fgetspent_r, [&all](const struct spwd &line) {
        all.shadows.push_back(keep(line, {&spwd::sp_namp, &spwd::sp_pwdp}));
    });
    read_file<struct group>(folder + "/group", fgetgrent_r, [&all](const struct group &line) {
        all.members.push_back(keep_list(line.gr_mem));
    });
    require(!all.users.empty() && all.users.size() == all.shadows.size(), "the users");
    return all;
}

static user *make_user(const struct passwd &line, const struct spwd &shadow) {
    const char *const texts[] = {line.pw_name, line.pw_gecos, line.pw_dir, line.pw_shell};
    std::size_t size = sizeof(user);
    for (const char *text : texts)
        size += strlen(text) + 1;
    auto *made = static_cast<user *>(g_malloc(size));
    made->uid = line.pw_uid;
    made->gid = line.pw_gid;
    made->last_change = shadow.sp_lstchg;
    made->password = g_strdup(shadow.sp_pwdp);
    char *room = reinterpret_cast<char *>(made + 1);
    for (std::size_t i = 0; i < G_N_ELEMENTS(texts); i++) {
        made->texts[i] = room;
        room = stpcpy(room, texts[i]) + 1;
    }
    return made;
}

static double now() {
    struct timespec time = {};
    (void)clock_gettime(CLOCK_MONOTONIC, &time);
    return static_cast<double>(time.tv_sec) * 1e6 + static_cast<double>(time.tv_nsec) / 1e3;
}

int main(int argc, char **argv) {
    if (argc != 2) {
        (void)fprintf(stderr, "usage: load_floor FOLDER\n");
        return 2;
    }
    const double start = now();
    const lines all = read_lines(argv[1]);

    GPtrArray *users = g_ptr_array_sized_new(static_cast<guint>(all.users.size()));
    GHashTable *names = g_hash_table_new_full(g_str_hash, g_str_equal, g_free, nullptr);
    for (std::size_t i = 0; i < all.users.size(); i++) {
        require(strcmp(all.users[i]->pw_name, all.shadows[i]->sp_namp) == 0, "the order of shadow");
        user *made = make_user(*all.users[i], *all.shadows[i]);
        g_ptr_array_add(users, made);
        (void)g_hash_table_insert(names, g_strdup(made->texts[0]), made);
    }
    for (char **member : all.members) {
        GHashTable *set = g_hash_table_new_full(g_str_hash, g_str_equal, g_free, nullptr);
        for (; *member != nullptr; member++)
            (void)g_hash_table_add(set, g_strdup(*member));
    }
    (void)printf("%.3f\n", now() - start);
}
