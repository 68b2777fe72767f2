// tests/unit/platform/boot_block.cpp: a boot block of two copies in files, and calls on it.
#include "tests/unit/platform/boot_block.h"

#include <cerrno>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <iterator>

#include <sys/mount.h>
#include <unistd.h>
#include <zlib.h>

#include <glib.h>

#include "platform/bootparam/bootparam.h"
#include "tests/unit/platform/child.h"
#include "tests/unit/platform/outcome.h"
#include "tests/unit/platform/private_etc.h"

static constexpr unsigned CHILD_SECONDS = 20;

static std::string describe(int result, int error, int number) {
    return std::to_string(result) + " error " + std::to_string(error) + " errno " +
           std::to_string(number);
}

const std::string BootParam::BLANK = describe(-982, ENODATA, ENODATA);
const std::string BootParam::ABSENT = describe(-988, ENOENT, ENOENT);
const std::string BootParam::INVALID = describe(-2, EINVAL, EINVAL);
const std::string BootParam::FULL = describe(-1, ENOSPC, ENOSPC);

std::string BootParam::failed(int number) {
    return describe(-1, number, number);
}

// Once for the process: nothing that a test leaves reaches the machine.
static bool is_private() {
    static const bool entered =
        enter_private_etc() &&
        mount("tmpfs", "/run/lock", "tmpfs", MS_NOSUID | MS_NODEV, "mode=1777") == 0;
    return entered;
}

void BootParam::SetUp() {
    ASSERT_TRUE(is_private());
    (void)unlink(LOCK);  // There is none before the first test.
    (void)unlink(CONFIG);
    write_file(CONFIG, config_of_two());
    make_blank();
}

void BootParam::write_file(const std::string &path, const std::string &text) {
    std::ofstream file(path, std::ios::binary | std::ios::trunc);
    file << text << std::flush;
    ASSERT_TRUE(file.good()) << path;
}

std::string BootParam::read_file(const std::string &path) {
    g_autofree char *text = nullptr;
    gsize length = 0;
    EXPECT_TRUE(g_file_get_contents(path.c_str(), &text, &length, nullptr)) << path;
    return {text, length};
}

// Erased flash reads as ones.
void BootParam::make_blank(std::size_t size) {
    write_file(copy(0), std::string(size, '\xff'));
    write_file(copy(1), std::string(size, '\xff'));
}

std::string BootParam::config_of_two(std::size_t size) {
    g_autofree char *hex = g_strdup_printf("0x%zx", size);
    return copy(0) + " 0x0 " + hex + "\n" + copy(1) + " 0x0 " + hex + "\n";
}

std::string BootParam::image(const std::string &parameters, const std::string &counter) {
    const auto crc = static_cast<std::uint32_t>(
        crc32_z(0, reinterpret_cast<const Bytef *>(parameters.data()), parameters.size()));
    std::string bytes(sizeof crc, '\0');
    std::memcpy(bytes.data(), &crc, sizeof crc);
    return bytes + counter + parameters;
}

void BootParam::break_copy(int number) {
    std::string bytes = read_file(copy(number));
    ASSERT_GT(bytes.size(), 5U);
    bytes[5] = static_cast<char>(bytes[5] ^ 1);
    write_file(copy(number), bytes);
}

static std::string told(int result, int error) {
    const int number = errno;
    return result == 0 ? "ok" : describe(result, error, number);
}

std::string BootParam::set_chip() {
    bootparam_chip chip;
    int error = 0;

    bootparam_default_chip(&chip);
    errno = 0;
    const int result = bootparam_set_chip(0, &error, &chip);
    return told(result, error);
}

std::string BootParam::read(const std::string &name) {
    bootparam_chip chip;
    int error = 0;
    char untouched = '\0';
    char *value = &untouched;

    bootparam_default_chip(&chip);
    errno = 0;
    const int result = bootparam_read(name.c_str(), &value, 0, &error, &chip);
    const std::string outcome = told(result, error);
    if (result != 0)
        return value == &untouched ? outcome : outcome + ", the value was touched";
    const std::string text = value;
    std::free(value);
    return "=" + text;
}

std::string BootParam::write(const std::string &name, const std::string &value) {
    bootparam_chip chip;
    int error = 0;

    bootparam_default_chip(&chip);
    errno = 0;
    const int result = bootparam_write(name.c_str(), value.c_str(), &error, &chip);
    return told(result, error);
}

// What a tool of U-Boot prints.
static std::string from_tool(const char *path, const char *first, const char *second) {
    const char *words[] = {path, first, second, nullptr};
    g_autofree char *output = nullptr;
    g_autofree char *complaints = nullptr;
    g_autoptr(GError) error = nullptr;
    g_autoptr(GStrvBuilder) builder = g_strv_builder_new();
    g_strv_builder_addv(builder, words);
    g_auto(GStrv) command = g_strv_builder_end(builder);
    int status = -1;

    if (g_spawn_sync(nullptr, command, nullptr, G_SPAWN_DEFAULT, nullptr, nullptr, &output,
                     &complaints, &status, &error) == FALSE)
        return std::string("not run: ") + error->message;
    return status == 0 ? output : std::string("failed: ") + complaints;
}

std::string BootParam::printed(const std::string &name) {
    return from_tool("/usr/bin/fw_printenv", "-n", name.c_str());
}

std::string BootParam::set_by_tool(const std::string &name, const std::string &value) {
    return from_tool("/usr/bin/fw_setenv", name.c_str(), value.c_str());
}

std::string BootParam::from_child(const std::function<std::string()> &work) {
    return text_from_child([&] {
        (void)alarm(CHILD_SECONDS);
        say(work());
    });
}
