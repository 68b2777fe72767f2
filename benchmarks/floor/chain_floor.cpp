// benchmarks/floor/chain_floor.cpp: what adding or removing an account costs at the very least: the
// hash, the three account files and the digest file replaced in their order with every sync, pidof
// and its signal, with the C library alone.
//
//   chain_floor hash|pidof|add|remove REPEATS FOLDER
//
// Removing is all of adding but the hash. FOLDER holds passwd, shadow, group and
// apache2/digest_auth_passwd, of which it writes other versions. Prints the microseconds that one
// takes, the median of the repeats.
#include <algorithm>
#include <cerrno>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <ctime>
#include <string>
#include <vector>

#include <crypt.h>
#include <fcntl.h>
#include <grp.h>
#include <pwd.h>
#include <shadow.h>
#include <spawn.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

static constexpr const char *PASSWORD = "benchmark7";

static void require(bool holds, const char *what) {
    if (holds)
        return;
    (void)fprintf(stderr, "chain_floor: %s: %s\n", what, strerror(errno));
    exit(EXIT_FAILURE);
}

// The records of the three files, read once; their strings are never freed.
struct accounts {
    std::vector<struct passwd> users;
    std::vector<struct spwd> shadows;
    std::vector<struct group> groups;
};

static char *keep(const char *text) {
    char *copy = strdup(text);
    require(copy != nullptr, "strdup");
    return copy;
}

static char **keep_list(char **list) {
    std::size_t length = 0;
    while (list[length] != nullptr)
        length++;
    auto **copy = static_cast<char **>(calloc(length + 1, sizeof *list));
    require(copy != nullptr, "calloc");
    for (std::size_t i = 0; i < length; i++)
        copy[i] = keep(list[i]);
    return copy;
}

static FILE *open_in(const std::string &folder, const char *name) {
    FILE *stream = fopen((folder + "/" + name).c_str(), "re");
    require(stream != nullptr, name);
    return stream;
}

static accounts read_accounts(const std::string &folder) {
    accounts all;
    FILE *stream = open_in(folder, "passwd");
    while (const struct passwd *user = fgetpwent(stream))
        all.users.push_back({keep(user->pw_name), keep(user->pw_passwd), user->pw_uid, user->pw_gid,
                             keep(user->pw_gecos), keep(user->pw_dir), keep(user->pw_shell)});
    (void)fclose(stream);
    stream = open_in(folder, "shadow");
    while (const struct spwd *shadow = fgetspent(stream)) {
        all.shadows.push_back(*shadow);
        all.shadows.back().sp_namp = keep(shadow->sp_namp);
        all.shadows.back().sp_pwdp = keep(shadow->sp_pwdp);
    }
    (void)fclose(stream);
    stream = open_in(folder, "group");
    while (const struct group *group = fgetgrent(stream))
        all.groups.push_back({keep(group->gr_name), keep(group->gr_passwd), group->gr_gid,
                              keep_list(group->gr_mem)});
    (void)fclose(stream);
    require(!all.users.empty() && !all.shadows.empty() && !all.groups.empty(), "no accounts");
    return all;
}

static void hash_password() {
    static constexpr char alphabet[] =
        "./0123456789ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz";
    unsigned char random[12];
    char salt[] = "$5$............$";
    const int fd = open("/dev/urandom", O_RDONLY | O_CLOEXEC);
    require(read(fd, random, sizeof random) == sizeof random, "/dev/urandom");
    (void)close(fd);
    for (std::size_t i = 0; i < sizeof random; i++)
        salt[3 + i] = alphabet[random[i] & 63];
    const char *hash = crypt(PASSWORD, salt);
    require(hash != nullptr && *hash == '$', "crypt");
}

static FILE *open_temporary(const std::string &path) {
    require(unlink(path.c_str()) == 0 || errno == ENOENT, "unlink");
    const int fd = open(path.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, 0600);
    require(fd >= 0 && fchmod(fd, 0600) == 0, path.c_str());
    return fdopen(fd, "w");
}

static void finish_temporary(FILE *stream, mode_t mode) {
    require(fflush(stream) == 0 && fchmod(fileno(stream), mode) == 0 &&
                fsync(fileno(stream)) == 0 && fclose(stream) == 0,
            "a temporary file");
}

static mode_t mode_of(const std::string &path) {
    struct stat status = {};
    require(stat(path.c_str(), &status) == 0, path.c_str());
    return status.st_mode & 07777;
}

static void rename_and_sync(const std::string &path, const std::string &folder) {
    require(rename((path + ".tmp").c_str(), path.c_str()) == 0, "rename");
    const int fd = open(folder.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC);
    require(fd >= 0 && fsync(fd) == 0 && close(fd) == 0, "the folder");
}

// All three are written before the first is renamed.
static void replace_files(const accounts &all, const std::string &folder) {
    const std::string paths[] = {folder + "/passwd", folder + "/shadow", folder + "/group"};
    mode_t mode = mode_of(paths[0]);
    FILE *stream = open_temporary(paths[0] + ".tmp");
    for (const struct passwd &user : all.users)
        require(putpwent(&user, stream) == 0, "putpwent");
    finish_temporary(stream, mode);

    mode = mode_of(paths[1]);
    stream = open_temporary(paths[1] + ".tmp");
    for (const struct spwd &shadow : all.shadows)
        require(putspent(&shadow, stream) == 0, "putspent");
    finish_temporary(stream, mode);

    mode = mode_of(paths[2]);
    stream = open_temporary(paths[2] + ".tmp");
    for (const struct group &group : all.groups)
        require(putgrent(&group, stream) == 0, "putgrent");
    finish_temporary(stream, mode);

    for (const std::string &path : paths)
        rename_and_sync(path, folder);
}

// Under its lock: read, written anew with its owner and mode, renamed.
static void replace_digests(const std::string &folder) {
    const std::string path = folder + "/apache2/digest_auth_passwd";
    const int lock =
        open((path + ".lock").c_str(), O_RDWR | O_CREAT | O_NOFOLLOW | O_CLOEXEC, 0600);
    require(lock >= 0 && flock(lock, LOCK_EX | LOCK_NB) == 0, "the lock");

    char text[65536];
    struct stat status = {};
    int fd = open(path.c_str(), O_RDONLY | O_NOFOLLOW | O_CLOEXEC);
    require(fd >= 0 && fstat(fd, &status) == 0, path.c_str());
    const ssize_t length = read(fd, text, sizeof text);
    require(length >= 0 && close(fd) == 0, "the digest file");

    const std::string temporary = path + ".tmp";
    require(unlink(temporary.c_str()) == 0 || errno == ENOENT, "unlink");
    fd = open(temporary.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, 0600);
    require(fd >= 0 && write(fd, text, static_cast<std::size_t>(length)) == length &&
                fchown(fd, status.st_uid, status.st_gid) == 0 &&
                fchmod(fd, status.st_mode & 07777) == 0 && fsync(fd) == 0 && close(fd) == 0,
            "the new digest file");
    rename_and_sync(path, folder + "/apache2");
    (void)close(lock);
}

static void signal_cfgstore() {
    int ends[2];
    char answer[64] = {};
    posix_spawn_file_actions_t actions;
    char program[] = "/bin/pidof";
    char argument[] = "cfgstore";
    char *const argv[] = {program, argument, nullptr};
    char *const environment[] = {nullptr};
    pid_t child = 0;

    require(pipe2(ends, O_CLOEXEC) == 0, "pipe");
    require(posix_spawn_file_actions_init(&actions) == 0 &&
                posix_spawn_file_actions_adddup2(&actions, ends[1], STDOUT_FILENO) == 0,
            "file actions");
    require(posix_spawn(&child, program, &actions, nullptr, argv, environment) == 0, program);
    (void)posix_spawn_file_actions_destroy(&actions);
    (void)close(ends[1]);
    require(read(ends[0], answer, sizeof answer - 1) > 0, "pidof found no cfgstore");
    (void)close(ends[0]);
    require(waitpid(child, nullptr, 0) == child, "wait");
    require(kill(static_cast<pid_t>(strtol(answer, nullptr, 10)), SIGUSR1) == 0, "kill");
}

static double now() {
    struct timespec time = {};
    (void)clock_gettime(CLOCK_MONOTONIC, &time);
    return static_cast<double>(time.tv_sec) * 1e6 + static_cast<double>(time.tv_nsec) / 1e3;
}

// What is measured, and what it consists of.
struct item {
    const char *name;
    bool hash;
    bool files;
    bool pidof;
};

static constexpr item items[] = {
    {"hash",   true,  false, false},
    {"pidof",  false, false, true },
    {"add",    true,  true,  true },
    {"remove", false, true,  true },
};

static void run_once(const item &measured, const accounts &all, const std::string &folder) {
    if (measured.hash)
        hash_password();
    if (measured.files) {
        replace_files(all, folder);
        replace_digests(folder);
    }
    if (measured.pidof)
        signal_cfgstore();
}

int main(int argc, char **argv) {
    const item *measured = nullptr;
    for (const item &known : items)
        if (argc == 4 && strcmp(argv[1], known.name) == 0)
            measured = &known;
    const int repeats = argc == 4 ? atoi(argv[2]) : 0;
    if (measured == nullptr || repeats < 1) {
        (void)fprintf(stderr, "usage: chain_floor hash|pidof|add|remove REPEATS FOLDER\n");
        return 2;
    }
    const std::string folder = argv[3];
    const accounts all = read_accounts(folder);
    run_once(*measured, all, folder);  // a warm-up that does not count
    std::vector<double> times;
    for (int i = 0; i < repeats; i++) {
        const double start = now();
        run_once(*measured, all, folder);
        times.push_back(now() - start);
    }
    const auto middle = times.begin() + repeats / 2;
    std::nth_element(times.begin(), middle, times.end());
    (void)printf("%.3f\n", *middle);
}
