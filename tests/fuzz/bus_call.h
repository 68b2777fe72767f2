// tests/fuzz/bus_call.h: a method call without a bus: what its method asked the authorization
// library, and how it answered.
#pragma once

#include <string>
#include <vector>

#include "service/method.h"

// One call at a time. Every answer is counted and held; what a message cannot carry ends the
// process.
class bus_call {
  public:
    bus_call();
    ~bus_call();
    bus_call(const bus_call &) = delete;
    bus_call &operator=(const bus_call &) = delete;

    // What the authorization library answers.
    bool is_allowed = true;
    // What it was asked.
    std::vector<std::string> actions;

    // To be handed to a method's work; the invocation is a place in memory and nothing else.
    method_call call;
    ServiceState state = {};

    // Runs the work as the frame does, and checks that there is one answer, of the kind that the
    // work's result tells of, and no error left.
    template <typename... in_args>
    bool serve(bool (*work)(method_call &, in_args...), in_args... in) {
        return end(work(call, in...));
    }
    bool end(bool done);

    int answers = 0;
    bool has_failed() const { return is_error; }
    // Of the last answer: its error, or its body in GVariant's text form where it is wanted.
    bool is_error = false;
    std::string domain;
    int code = 0;
    std::string text;
    // The first string of the body, "" where there is none.
    std::string first_string;

    // For the wrapped calls.
    void answer(GVariant *body);
    void answer_error(GQuark error_domain, int error_code, const char *message);
};
