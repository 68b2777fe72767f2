// tests/long/faults/proof.h: what every proof has: its command line, its failures, its figures.
#pragma once

#include <chrono>
#include <map>
#include <string>
#include <vector>

#include <glib.h>

struct proof_options {
    guint64 amount = 0;
    guint64 seed = 0;
    std::string figures;  // the file that they go to
};

// False, and the usage told, for any other line than --amount N [--seed S] [--figures FILE].
bool read_proof_options(int count, char **words, proof_options *out_options);

// Counts, and collects what went wrong.
class proof_report {
  public:
    explicit proof_report(const char *name) : name_(name) {}

    void count(const std::string &figure, guint64 more = 1) { figures_[figure] += more; }
    guint64 figure(const std::string &figure) { return figures_[figure]; }
    // With all that is needed to see it again.
    void fail(const std::string &text);
    bool is_hopeless() const { return failures_.size() >= MAX_FAILURES; }

    // Prints the figure from time to time.
    void tell_progress(const std::string &figure);

    // Prints the failures and the figures, and writes those to the file. The exit status.
    int finish(const proof_options &options);

  private:
    // More of them tell no more.
    static constexpr std::size_t MAX_FAILURES = 20;

    const char *name_;
    std::map<std::string, guint64> figures_;
    std::vector<std::string> failures_;
    std::chrono::steady_clock::time_point start_ = std::chrono::steady_clock::now();
    std::chrono::steady_clock::time_point last_told_ = start_;
};

// Exit statuses.
constexpr int PROOF_USAGE = 2;
constexpr int PROOF_CANNOT_RUN = 125;
