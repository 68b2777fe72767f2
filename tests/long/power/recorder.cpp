// tests/long/power/recorder.cpp: runs in the camera, and calls the service while its writes are
// logged.
//
//   recorder LOGGED_DEVICE FOLDER BOOT_DEVICE PLAN
//
// A line of the plan is a method and its arguments as GLib prints them, or "write NAME SIZE" for a
// file that another program writes and nobody syncs, or "pause MILLISECONDS". Before a method, the
// word "watched" has another program sync a file of its own whenever an account file was replaced,
// which brings the replacement to the disk before the service asks for it. The log is marked
// with "begin-N" before and "answer-N" after the Nth line: what stands before a mark had reached
// the disk when it was set. Prints what was answered, and each watched file whenever it has
// changed.
#include <atomic>
#include <cerrno>
#include <cstddef>
#include <cstdio>
#include <cstdlib>
#include <cstring>

#include <fcntl.h>
#include <linux/dm-ioctl.h>
#include <sys/inotify.h>
#include <sys/ioctl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <gio/gio.h>

static constexpr const char *NAME = "com.zintor.PrivaneSystem";
static constexpr const char *OBJECT = "/com/zintor/PrivaneSystem";
static constexpr const char *WATCHED = "watched ";
static constexpr int CALL_MS = 60'000;
static constexpr std::size_t BOOT_COPIES = 0x8000;

struct watched_file {
    const char *name;
    const char *path;
    char *last;
};
static watched_file watched_files[] = {
    {"passwd",     "etc/passwd",                     nullptr},
    {"shadow",     "etc/shadow",                     nullptr},
    {"group",      "etc/group",                      nullptr},
    {"digest",     "etc/apache2/digest_auth_passwd", nullptr},
    {"parameters", "etc/privane/parameters.conf",    nullptr},
    {"boot",       nullptr,                          nullptr},
};

[[noreturn]] static void give_up(const char *doing, const char *why) {
    (void)std::fprintf(stderr, "%s: %s\n", doing, why);
    std::exit(1);
}

// The log of a device, which takes marks as messages to the device mapper.
class write_log {
  public:
    explicit write_log(const char *device)
        : device_(device), control_(open("/dev/mapper/control", O_RDWR | O_CLOEXEC)) {}
    ~write_log() { (void)close(control_); }  // Nothing waits to be written.
    write_log(const write_log &) = delete;
    write_log &operator=(const write_log &) = delete;

    void mark(const char *word, guint number) const {
        struct {
            dm_ioctl head;
            // What dm_target_msg has: a sector, which nobody asks for here, and the text.
            __u64 sector;
            char text[64];
        } request = {};
        request.head.version[0] = DM_VERSION_MAJOR;
        request.head.data_size = sizeof request;
        request.head.data_start = offsetof(decltype(request), sector);
        (void)g_strlcpy(request.head.name, device_, sizeof request.head.name);
        (void)g_snprintf(request.text, sizeof request.text, "mark %s-%u", word, number);
        if (ioctl(control_, DM_TARGET_MSG, &request) != 0)
            give_up("marking the log", g_strerror(errno));
    }

  private:
    const char *device_;
    int control_;
};

static char *base64_of(int fd, std::size_t limit) {
    g_autofree auto *bytes = static_cast<guchar *>(g_malloc(limit));
    std::size_t length = 0;
    for (ssize_t count = 1; count > 0 && length < limit; length += static_cast<std::size_t>(count))
        if ((count = read(fd, bytes + length, limit - length)) < 0)
            give_up("reading a watched file", g_strerror(errno));
    return g_base64_encode(bytes, length);
}

// What the record says of a file: "absent", or its mode, owner, group and content.
static char *describe(const char *path, std::size_t limit) {
    const int fd = open(path, O_RDONLY | O_CLOEXEC);
    if (fd < 0 && errno == ENOENT)
        return g_strdup("absent");
    struct stat status = {};
    if (fd < 0 || fstat(fd, &status) != 0)
        give_up(path, g_strerror(errno));
    g_autofree char *content = base64_of(fd, limit);
    (void)close(fd);  // It was only read from.
    return g_strdup_printf("%o %u %u %s", status.st_mode & 07777, status.st_uid, status.st_gid,
                           content);
}

// Prints the files that are not what they were.
static void print_changes(const char *folder, const char *boot_device) {
    for (watched_file &file : watched_files) {
        g_autofree char *path = file.path != nullptr ? g_build_filename(folder, file.path, nullptr)
                                                     : g_strdup(boot_device);
        char *now = describe(path, file.path != nullptr ? 1 << 20 : BOOT_COPIES);
        if (g_strcmp0(now, file.last) != 0)
            g_print("file %s %s\n", file.name, now);
        g_free(file.last);
        file.last = now;
    }
}

static void write_unsynced(const char *folder, const char *words) {
    char name[64];
    unsigned size = 0;
    if (std::sscanf(words, "%63s %u", name, &size) != 2)
        give_up("a line of the plan", words);
    g_autofree char *path = g_build_filename(folder, name, nullptr);
    g_autofree char *content = g_strnfill(size, 'n');
    FILE *file = std::fopen(path, "we");
    if (file == nullptr || std::fputs(content, file) < 0 || std::fclose(file) != 0)
        give_up(path, g_strerror(errno));
}

static char *call_service(GDBusConnection *bus, const char *method, const char *text) {
    g_autoptr(GError) error = nullptr;
    GVariant *arguments = g_variant_parse(nullptr, text, nullptr, nullptr, &error);
    if (arguments == nullptr)
        give_up(text, error->message);
    g_autoptr(GVariant) reply =
        g_dbus_connection_call_sync(bus, NAME, OBJECT, NAME, method, arguments, nullptr,
                                    G_DBUS_CALL_FLAGS_NONE, CALL_MS, nullptr, &error);
    return reply != nullptr ? g_strdup("ok") : g_strdup(error->message);
}

// Another program on the same file system. It ends with this process.
class watcher {
  public:
    explicit watcher(const char *folder)
        : inotify_(inotify_init1(IN_CLOEXEC)), own_(g_build_filename(folder, "watcher", nullptr)) {
        for (const char *name : {"etc", "etc/apache2"}) {
            g_autofree char *path = g_build_filename(folder, name, nullptr);
            if (inotify_add_watch(inotify_, path, IN_MOVED_TO) < 0)
                give_up(path, g_strerror(errno));
        }
        g_thread_unref(g_thread_new("watcher", watch, this));
    }

    void set_active(bool active) { active_ = active; }

  private:
    static gpointer watch(gpointer data) {
        auto *self = static_cast<watcher *>(data);
        const int fd = open(self->own_, O_WRONLY | O_CREAT | O_CLOEXEC, 0600);
        alignas(inotify_event) char events[4096];
        while (read(self->inotify_, events, sizeof events) > 0)
            if (self->active_ && (pwrite(fd, events, sizeof events, 0) < 0 || fsync(fd) != 0))
                give_up(self->own_, g_strerror(errno));
        return nullptr;
    }

    int inotify_;
    char *own_;
    std::atomic<bool> active_ = false;
};

static char *follow(const char *line, const char *folder, GDBusConnection *bus) {
    const char *blank = std::strchr(line, ' ');
    if (blank == nullptr)
        give_up("a line of the plan", line);
    g_autofree char *word = g_strndup(line, static_cast<gsize>(blank - line));
    if (g_str_equal(word, "write"))
        write_unsynced(folder, blank + 1);
    else if (g_str_equal(word, "pause"))
        g_usleep(1000 * g_ascii_strtoull(blank, nullptr, 10));
    else
        return call_service(bus, word, blank + 1);
    return g_strdup("ok");
}

static GDBusConnection *connect_as_a_caller_of_its_own() {
    g_autoptr(GError) error = nullptr;
    g_autofree char *address = g_dbus_address_get_for_bus_sync(G_BUS_TYPE_SYSTEM, nullptr, &error);
    GDBusConnection *bus =
        address == nullptr
            ? nullptr
            : g_dbus_connection_new_for_address_sync(
                  address,
                  static_cast<GDBusConnectionFlags>(G_DBUS_CONNECTION_FLAGS_AUTHENTICATION_CLIENT |
                                                    G_DBUS_CONNECTION_FLAGS_MESSAGE_BUS_CONNECTION),
                  nullptr, nullptr, &error);
    if (bus == nullptr)
        give_up("the bus", error->message);
    return bus;
}

static void follow_plan(char **lines, const write_log &log, const char *folder,
                        const char *boot_device) {
    // They take turns.
    GDBusConnection *callers[] = {connect_as_a_caller_of_its_own(),
                                  connect_as_a_caller_of_its_own()};

    auto *other = new watcher(folder);  // Its thread may look at it until the end.
    print_changes(folder, boot_device);
    log.mark("start", 0);
    for (guint number = 1; lines[number - 1] != nullptr; number++) {
        const char *line = lines[number - 1];
        const bool watched = g_str_has_prefix(line, WATCHED);
        other->set_active(watched);
        log.mark("begin", number);
        g_autofree char *answer = follow(watched ? line + std::strlen(WATCHED) : line, folder,
                                         callers[number % G_N_ELEMENTS(callers)]);
        log.mark("answer", number);
        g_print("answer %u %s\n", number, g_strdelimit(answer, "\n", ' '));
        print_changes(folder, boot_device);
    }
    for (GDBusConnection *bus : callers)
        g_object_unref(bus);
}

int main(int argc, char **argv) {
    if (argc != 5)
        give_up("usage", "recorder LOGGED_DEVICE FOLDER BOOT_DEVICE PLAN");
    g_autofree char *plan = nullptr;
    g_autoptr(GError) error = nullptr;
    if (!g_file_get_contents(argv[4], &plan, nullptr, &error))
        give_up(argv[4], error->message);
    g_auto(GStrv) lines = g_strsplit(g_strchomp(plan), "\n", -1);
    follow_plan(lines, write_log(argv[1]), argv[2], argv[3]);
    return 0;
}
