// tests/long/faults/proof.cpp: what every proof has: its command line, its failures, its figures.
#include "tests/long/faults/proof.h"

#include <cstdio>
#include <filesystem>
#include <fstream>

static bool read_number(const char *text, guint64 *out_number) {
    return g_ascii_string_to_unsigned(text, 10, 0, G_MAXUINT64, out_number, nullptr) != FALSE;
}

static bool read_words(int count, char **words, proof_options *out_options) {
    bool has_amount = false;
    for (int i = 1; i + 1 < count; i += 2) {
        const std::string name = words[i];
        if (name == "--amount" && read_number(words[i + 1], &out_options->amount))
            has_amount = out_options->amount > 0;
        else if (name == "--figures")
            // The proofs work in a folder of their own.
            out_options->figures = std::filesystem::absolute(words[i + 1]);
        else if (name != "--seed" || !read_number(words[i + 1], &out_options->seed))
            return false;
    }
    return count % 2 == 1 && has_amount;
}

bool read_proof_options(int count, char **words, proof_options *out_options) {
    if (read_words(count, words, out_options))
        return true;
    (void)std::fprintf(stderr, "usage: %s --amount N [--seed S] [--figures FILE]\n", words[0]);
    return false;
}

void proof_report::fail(const std::string &text) {
    count("failures");
    if (is_hopeless())
        return;
    failures_.push_back(text);
}

void proof_report::tell_progress(const std::string &figure) {
    using std::chrono::steady_clock;
    if (steady_clock::now() - last_told_ < std::chrono::seconds(10))
        return;
    last_told_ = steady_clock::now();
    (void)std::printf("%s: %s %" G_GUINT64_FORMAT " so far\n", name_, figure.c_str(),
                      figures_[figure]);
    (void)std::fflush(stdout);
}

// At most that many lines.
static std::string shortened(const std::string &text) {
    constexpr int LINES = 40;
    std::size_t end = 0;
    for (int i = 0; i < LINES; i++) {
        end = text.find('\n', end);
        if (end == text.npos)
            return text;
        end++;
    }
    return text.substr(0, end) + "...";
}

int proof_report::finish(const proof_options &options) {
    for (const std::string &failure : failures_)
        (void)std::printf("FAILURE with --seed %" G_GUINT64_FORMAT ": %s\n\n", options.seed,
                          shortened(failure).c_str());
    const std::chrono::duration<double> taken = std::chrono::steady_clock::now() - start_;
    count("seconds", static_cast<guint64>(taken.count() + 0.5));
    count("failures", 0);

    std::string json;
    std::string told;
    for (const auto &[name, number] : figures_) {
        json += (json.empty() ? "{\"" : ", \"") + name + "\": " + std::to_string(number);
        told += " " + name + " " + std::to_string(number);
    }
    (void)std::printf("%s:%s\n", name_, told.c_str());
    if (!options.figures.empty()) {
        std::ofstream file(options.figures, std::ios::trunc);
        file << json << "}\n" << std::flush;
        if (!file.good()) {
            (void)std::fprintf(stderr, "cannot write %s\n", options.figures.c_str());
            return PROOF_CANNOT_RUN;
        }
    }
    return figures_["failures"] == 0 ? 0 : 1;
}
