// platform/digest_entry/digest_lines.cpp: reads the lines of a digest file as Apache does, and
// those of the lists.
#include "platform/digest_entry/digest_lines.h"

#include <type_traits>

// Apache gives up on a file at a line of 8 KiB, and with it on every user behind that line.
static constexpr std::size_t MAX_USER = 255;

static constexpr std::string_view BLANKS = " \t\n\v\f\r";
static constexpr std::string_view HASH_DIGITS = "0123456789abcdef";

bool digest_is_user(std::string_view user) {
    return !user.empty() && user.size() <= MAX_USER &&
           user.find_first_of(":\n\r") == std::string_view::npos && user.front() != '#' &&
           BLANKS.find(user.front()) == std::string_view::npos;
}

// Where a line, given without its line feed, goes on in the next one: at a backslash that is its
// last byte, or the last but a carriage return. npos where it does not.
static std::size_t find_continuation(std::string_view line) {
    if (line.ends_with('\r'))
        line.remove_suffix(1);
    return line.ends_with('\\') ? line.size() - 1 : std::string_view::npos;
}

static std::string_view without_blanks_around(std::string_view text) {
    const std::size_t first = text.find_first_not_of(BLANKS);

    if (first == std::string_view::npos)
        return {};
    return text.substr(first, text.find_last_not_of(BLANKS) - first + 1);
}

// Cuts the text before the next ":" off; any number of them separates like one.
static std::string_view take_word(std::string_view *rest) {
    const std::size_t colon = rest->find(':');
    const std::string_view word = rest->substr(0, colon);
    const std::size_t next = rest->find_first_not_of(':', word.size());

    *rest = next != std::string_view::npos ? rest->substr(next) : std::string_view();
    return word;
}

// Joins the lines that Apache reads as the first one. takes_next is about what comes behind the
// last of them, once that has an end.
static void join_lines(std::string_view text, found_line *line, wiped_text *joined) {
    joined->truncate(0);
    do {
        const std::string_view rest = text.substr(line->length);
        const std::size_t end = rest.find('\n');
        const std::string_view part = rest.substr(0, end);
        const std::size_t nul = part.find('\0');

        line->length += end != std::string_view::npos ? end + 1 : rest.size();
        joined->append(part.substr(0, nul));
        // A NUL hides the rest of its line, and a backslash there does not count.
        const std::size_t continuation = nul == std::string_view::npos
                                             ? find_continuation(joined->view())
                                             : std::string_view::npos;
        line->takes_next = continuation != std::string_view::npos;
        // The last line may lack its end, which it gets when the file is written.
        if (line->takes_next)
            joined->truncate(continuation);
    } while (line->takes_next && line->length < text.size());
}

found_line digest_read_line(std::string_view text, wiped_text *scratch) {
    found_line line = {};

    join_lines(text, &line, scratch);
    std::string_view rest = without_blanks_around(scratch->view());
    if (rest.starts_with('#'))
        return line;
    line.key = take_word(&rest);
    line.is_entry = take_word(&rest) == DIGEST_REALM;
    return line;
}

// Cuts the next line off, without its end. The last one may lack the end.
static std::string_view take_line(std::string_view *list) {
    const std::string_view line = list->substr(0, list->find('\n'));

    list->remove_prefix(line.size() < list->size() ? line.size() + 1 : line.size());
    return line;
}

// The user of a line "user:realm:hash"; empty where it is none.
static std::string_view user_of(std::string_view line) {
    const std::string_view user = line.substr(0, line.find(':'));
    std::string_view rest = line.substr(user.size());

    if (!digest_is_user(user) || rest.size() != 1 + DIGEST_REALM.size() + 1 + DIGEST_HASH_LENGTH)
        return {};
    rest.remove_prefix(1);
    if (!rest.starts_with(DIGEST_REALM) || rest[DIGEST_REALM.size()] != ':')
        return {};
    rest.remove_prefix(DIGEST_REALM.size() + 1);
    return rest.find_first_not_of(HASH_DIGITS) == std::string_view::npos ? user
                                                                         : std::string_view();
}

static void append_change(GArray *changes, std::string_view user, std::string_view line) {
    const line_change change = {user, line};
    static_assert(std::is_trivially_copyable_v<line_change>);

    g_array_append_val(changes, change);
}

bool digest_read_set_list(std::string_view list, GArray *out_changes) {
    while (!list.empty()) {
        const std::string_view line = take_line(&list);
        const std::string_view user = user_of(line);

        if (user.empty())
            return false;
        append_change(out_changes, user, line);
    }
    return true;
}

bool digest_read_delete_list(std::string_view list, GArray *out_changes) {
    while (!list.empty()) {
        const std::string_view line = take_line(&list);
        const std::string_view user = digest_is_user(line) ? line : user_of(line);

        if (user.empty())
            return false;
        append_change(out_changes, user, {});
    }
    return true;
}
