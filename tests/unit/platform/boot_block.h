// tests/unit/platform/boot_block.h: a boot block of two copies in files, and calls on it.
#pragma once

#include <cstddef>
#include <functional>
#include <string>

#include <gtest/gtest.h>

// Lays a /etc of its own under each test, with a description of the boot block in it, and an empty
// folder of locks. The copies are /etc/copy0 and /etc/copy1.
class BootParam : public testing::Test {
  protected:
    static constexpr std::size_t COPY_SIZE = 0x4000;
    static constexpr const char *CONFIG = "/etc/fw_env.config";
    static constexpr const char *LOCK = "/run/lock/fw_printenv.lock";

    void SetUp() override;

    static void write_file(const std::string &path, const std::string &text);
    static std::string read_file(const std::string &path);
    static std::string copy(int number) { return "/etc/copy" + std::to_string(number); }
    // Copies that were never written.
    static void make_blank(std::size_t size = COPY_SIZE);
    // The description of the two copies.
    static std::string config_of_two(std::size_t size = COPY_SIZE);
    // A copy with a right CRC; the counter, where there is one, stands between it and the bytes.
    static std::string image(const std::string &parameters, const std::string &counter = "");
    // Changes a byte among the parameters, so that the CRC is wrong.
    static void break_copy(int number);

    // Each makes the calls as a caller would, from the default chip on, and tells the outcome:
    // "ok", or "RESULT error ERROR errno ERRNO".
    static std::string set_chip();
    // The value behind a "=" where it is ok.
    static std::string read(const std::string &name);
    static std::string write(const std::string &name, const std::string &value);

    // As U-Boot's own tool prints the value.
    static std::string printed(const std::string &name);
    // "" when U-Boot's own tool has set it.
    static std::string set_by_tool(const std::string &name, const std::string &value);

    // In a child that must end within seconds, which a wait for ever does not.
    static std::string from_child(const std::function<std::string()> &work);

    static const std::string BLANK;
    static const std::string ABSENT;
    static const std::string INVALID;
    static const std::string FULL;
    // The outcome of a failure with that errno value.
    static std::string failed(int number);
};
