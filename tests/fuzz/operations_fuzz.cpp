// tests/fuzz/operations_fuzz.cpp: any operations in any order, with calls that fail, against a
// simple model of what memory and files have to hold.
#include <utility>

#include "tests/fuzz/fuzz.h"
#include "tests/unit/usermgmt/operation_runner.h"

static constexpr int MAX_OPERATIONS = 6;

// A choice is one byte, so that a changed byte changes one choice; a day and more need stretching.
static constexpr gint64 TIME_STEP = 675;

static void run(operation_runner *runner, chosen_bytes *input) {
    random_operations chance([input] { return guint64{input->next()}; });
    const starting_files files = chance.next_files();
    std::vector<operation> done;
    std::string fault = runner->start(files, 'A');

    for (int i = 0; fault.empty() && i < MAX_OPERATIONS && !input->is_empty(); i++) {
        operation what = chance.next_operation(files.has_shadow);
        what.seconds_later *= TIME_STEP;
        fault = runner->run(what);
        done.push_back(std::move(what));
    }
    hold(fault.empty(), "memory and files are as the operations leave them", [&] {
        std::string text = "open flags " + std::to_string(files.open_flags);
        for (const operation &what : done)
            text += "\n" + described(what);
        return text + "\n" + fault;
    });
}

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size) {
    chosen_bytes input(data, size);
    operation_runner runner;

    run(&runner, &input);
    runner.close();
    (void)take_syslog();
    return 0;
}
