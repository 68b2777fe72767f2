// tests/fuzz/parameters_fuzz.cpp: parameters stored in a file of any content. The input is the file
// and, in a second part, a name, a ">" and a value in each line.
#include <optional>
#include <utility>

#include "platform/paramcli/param_file.h"
#include "platform/paramcli/param_options.h"
#include "tests/fuzz/fuzz.h"
#include "tests/fuzz/memory_folder.h"

static constexpr const char *NAME = "parameters.conf";
static constexpr std::size_t MAX_FILE = 1U << 20;

using parameter = std::pair<std::string, std::string>;

static bool is_name(const std::string &name) {
    for (const char byte : name)
        if (static_cast<unsigned char>(byte) < 32 || byte == 127 || byte == '=')
            return false;
    return !name.empty() && name.front() != '#' && name.front() != ' ' && name.back() != ' ';
}

static bool is_value(const std::string &value) {
    return value.find('\n') == std::string::npos && value.find('\r') == std::string::npos;
}

// Those that are taken.
static std::vector<parameter> add_all(const std::string &text, paramcli_options *options) {
    std::vector<parameter> added;
    for (const std::string_view line : lines_of(text)) {
        const std::size_t middle = line.find('>');
        const std::string name(line.substr(0, middle));
        const std::string value(middle != std::string_view::npos ? line.substr(middle + 1) : "");
        const std::size_t room = sizeof options->pending - options->length;
        const unsigned length = options->length;
        const int number = param_options_add(options, name, value);

        const bool is_taken =
            is_name(name) && is_value(value) && name.size() + value.size() + 2 <= room;
        hold((number == PARAMCLI_ERROR_NONE) == is_taken, "only what is valid and fits is taken",
             line);
        hold(param_options_are_valid(options), "a block stays valid", line);
        hold(is_taken || options->length == length, "a refusal leaves the block as it was", line);
        if (is_taken)
            added.emplace_back(name, value);
    }
    return added;
}

static std::optional<std::string_view> name_of(std::string_view line) {
    const std::size_t equals = line.find('=');
    if (equals == std::string_view::npos || line.starts_with('#'))
        return std::nullopt;
    return line.substr(0, equals);
}

// The file as it has to become, by the simplest means.
static std::string expected(const std::string &text, const std::vector<parameter> &added) {
    std::vector<parameter> wanted;  // in the order of the last value of each name
    for (const parameter &one : added) {
        std::erase_if(wanted, [&one](const parameter &old) { return old.first == one.first; });
        wanted.push_back(one);
    }
    std::string changed;
    std::vector<bool> is_done(wanted.size(), false);
    const auto put = [&](std::size_t i) {
        if (!is_done[i])
            changed += wanted[i].first + "=" + wanted[i].second + "\n";
        is_done[i] = true;
    };
    for (const std::string_view line : lines_of(text)) {
        const std::optional<std::string_view> name = name_of(line);
        std::size_t i = 0;
        while (i < wanted.size() && name != wanted[i].first)
            i++;
        if (i < wanted.size())
            put(i);
        else
            changed.append(line).append("\n");
    }
    for (std::size_t i = 0; i < wanted.size(); i++)
        put(i);
    return changed;
}

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size) {
    static const std::string path = memory_folder_path() + "/" + NAME;
    const std::vector<std::string> parts = parts_of(data, size);
    const std::string &text = parts[0];
    paramcli_options options;

    lay_in_memory_folder(NAME, text);
    param_options_reset(&options);
    const std::vector<parameter> added = add_all(parts.size() > 1 ? parts[1] : "", &options);
    const std::string wanted = added.empty() ? text : expected(text, added);
    const int number = param_file_sync(path.c_str(), &options);

    if (wanted.size() > MAX_FILE) {
        hold(number == PARAMCLI_ERROR_TOO_BIG && text_in_memory_folder(NAME) == text,
             "a file that is too big stays as it was");
        return 0;
    }
    hold(number == PARAMCLI_ERROR_NONE, "valid parameters are stored", std::to_string(number));
    hold(options.length == 0, "what was stored is no longer pending");
    hold(count_in_memory_folder() <= 2, "beside the file there is its lock, and nothing else");
    const std::string stored = text_in_memory_folder(NAME);
    hold(stored == wanted, "the file becomes what it should",
         [&] { return stored + "\ninstead of\n" + wanted; });
    return 0;
}
