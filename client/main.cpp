// client/main.cpp: privanectl, the command line of the service.
#include <cstdio>
#include <cstdlib>

#include <sys/prctl.h>
#include <unistd.h>

#include "client/answer_output.h"
#include "client/arguments.h"
#include "client/client_error.h"
#include "client/error_text.h"
#include "client/session.h"
#include "client/verb_list.h"
#include "client/verbs.h"

static constexpr int EXIT_USAGE = 2;

static bool call_service(const session &run, GError **error) {
    const GDBusMethodInfo *method = method_find(run.asked->method);
    GVariant *arguments = arguments_build(*run.asked, *run.line, error);

    if (arguments == nullptr)
        return false;
    g_autoptr(GVariant) results = session_call(run, method, arguments, error);
    if (results == nullptr || (run.asked->judge != nullptr && !run.asked->judge(results, error)))
        return false;
    g_autofree char *text = answer_format(run, method, results);
    return session_print(text, error);
}

static bool show_help(const command_line &line, GError **error) {
    const char *noun = word_at(line, 0);
    const bool knows_noun = noun == nullptr || noun_is_known(noun);

    if (!knows_noun)
        return command_find(line, error) != nullptr;
    g_autofree char *text = help_format(noun);
    return session_print(text, error);
}

static bool run_command_line(const command_line &line, bool on_terminal, GError **error) {
    const char *terminal = g_getenv("TERM");
    const char *no_color = g_getenv("NO_COLOR");
    const bool in_color = on_terminal && g_strcmp0(terminal, "dumb") != 0 &&
                          (no_color == nullptr || *no_color == '\0');

    if (line.options[OPTION_HELP] != nullptr)
        return show_help(line, error);
    if (line.options[OPTION_VERSION] != nullptr)
        return session_print("privanectl " PROJECT_VERSION "\n", error);
    const command *asked = command_find(line, error);
    if (asked == nullptr || !command_check(*asked, line, error))
        return false;
    const session run = {&line, asked, on_terminal, in_color};
    session_choose_bus(run);
    return asked->run != nullptr ? asked->run(run, error) : call_service(run, error);
}

int main(int argc, char **argv) {
    (void)prctl(PR_SET_DUMPABLE, 0);  // No core and no debugger of the same user sees a password.
    const bool on_terminal = isatty(STDOUT_FILENO) == 1;
    g_auto(command_line) line = {};
    g_autoptr(GError) error = nullptr;

    if (command_line_parse(argc, argv, on_terminal, &line, &error) &&
        run_command_line(line, on_terminal, &error))
        return EXIT_SUCCESS;
    g_autofree char *text = error_text_line(error);
    (void)std::fprintf(stderr, "privanectl: %s\n", text);  // There is no other place to tell it.
    return g_error_matches(error, CLIENT_ERROR, CLIENT_ERROR_USAGE) ? EXIT_USAGE : EXIT_FAILURE;
}
