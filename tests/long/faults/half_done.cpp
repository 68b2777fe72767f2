// tests/long/faults/half_done.cpp: what an account operation leaves that ended between the
// replacement of two files: the list of all that may be met.
#include "tests/long/faults/half_done.h"

#include <algorithm>
#include <cstdio>
#include <iterator>

static const half_done known[] = {
    {"add user",                            "passwd",
     "\n4 Failed to parse user 'svc': no corresponding shadow entry was found for 'svc'",     "done",
     ""                                                                                           },
    {"add user",                            "passwd shadow", "",                              "usermgmt 6: Failed to add user 'svc', user already exists",
     "\n- video:x:44:alice,svc"
     "\n- users:x:100:alice,bob,svc"
     "\n+ video:x:44:alice"
     "\n+ users:x:100:alice,bob"                                                                  },
    {"add user with a UID",                 "passwd",
     "\n4 Failed to parse user 'web1': no corresponding shadow entry was found for 'web1'",   "done",
     ""                                                                                           },
    {"add user with a UID",                 "passwd shadow", "",
     "usermgmt 6: Failed to add user 'web1', user already exists",                                                                                                          "\n- users:x:100:alice,bob,web1"
     "\n+ users:x:100:alice,bob"},
    {"modify primary group",                "passwd",        "",                              "done",
     "\n- users:x:100:alice,bob,camd"
     "\n- camera:x:995:"
     "\n+ users:x:100:alice,bob"
     "\n+ camera:x:995:camd"                                                                      },
    {"modify everything",                   "passwd",        "",                              "done",
     "\n- users:x:100:alice,bob,camd"
     "\n+ users:x:100:alice,bob"                                                                  },
    {"modify everything",                   "passwd shadow", "",                              "done",
     "\n- users:x:100:alice,bob,camd"
     "\n+ users:x:100:alice,bob"                                                                  },
    {"delete user",                         "passwd",
     "\n4 Group 'video' lists member 'alice', which has no passwd line"
     "\n4 Group 'audio' lists member 'alice', which has no passwd line"
     "\n4 Group 'users' lists member 'alice', which has no passwd line",                      "usermgmt 3: Failed to delete user 'alice', cannot delete non-existent user",
     "\n+ alice:$5$abcdefghijkl$hash:19005:0:99999:7:0::"
     "\n- video:x:44:"
     "\n- audio:x:45:bob"
     "\n- users:x:100:bob"
     "\n+ video:x:44:alice"
     "\n+ audio:x:45:alice,bob"
     "\n+ users:x:100:alice,bob"                                                                  },
    {"delete user",                         "passwd shadow",
     "\n4 Group 'video' lists member 'alice', which has no passwd line"
     "\n4 Group 'audio' lists member 'alice', which has no passwd line"
     "\n4 Group 'users' lists member 'alice', which has no passwd line",                      "usermgmt 3: Failed to delete user 'alice', cannot delete non-existent user",
     "\n- video:x:44:"
     "\n- audio:x:45:bob"
     "\n- users:x:100:bob"
     "\n+ video:x:44:alice"
     "\n+ audio:x:45:alice,bob"
     "\n+ users:x:100:alice,bob"                                                                  },
    {"disable password in the passwd file", "passwd",
     "\n4 Failed to parse user 'plain': no corresponding shadow entry was found for 'plain'", "usermgmt 3: Failed to disable password for  'plain', user does not exist",
     "\n- plain:*:0:0:99999:7:0::"                                                                },
};

static std::string shown(const half_done &row) {
    return row.operation + ", new: " + row.replaced + "\n    log:" + row.log +
           "\n    repeated: " + row.answer + "\n    left:" + row.left;
}

std::string half_done_list::check(const half_done &met) {
    met_[met.operation + ": " + met.replaced] = met;
    return std::find(std::begin(known), std::end(known), met) != std::end(known)
               ? ""
               : "a state that is not on the list: " + shown(met);
}

void half_done_list::finish(proof_report *report) const {
    for (const auto &[key, row] : met_)
        (void)std::printf("half done: %s\n", shown(row).c_str());
    for (const half_done &row : known)
        if (met_.count(row.operation + ": " + row.replaced) == 0)
            report->fail("a state of the list was never met: " + shown(row));
}
