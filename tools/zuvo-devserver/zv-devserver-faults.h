// Fault injection of the development server: rules set by --fault or POST /_admin/fault,
// matched against each request by its kind, and the effects they have on that request.
// Thread safety: a FaultTable may be used from every connection thread at once.
#pragma once

#include <cstdint>
#include <mutex>
#include <string>
#include <vector>

#include "zv-devserver-text.h"

namespace zv_devserver {

// What a request is, from its method and path.
enum class Kind { Meta, Data, Status, Login, Token, Category, Schema, Admin, Other };

const char *kind_name(Kind kind);

// The effects of the rules that fired for one request.
struct FaultEffects {
    int status = 0;               // answer this status instead of serving the request
    std::string status_body;      // body of that answer
    bool has_status_body = false;
    int64_t cut_at = -1;          // close the connection once this many body bytes arrived
    double rate = 0;              // read the body at this many bytes per second
    double stall = 0;             // seconds to wait before the answer
    int64_t big_header = 0;       // pad the answer's header block to at least this many bytes
    bool no_location = false;     // drop the Location header of a metadata answer
    std::vector<std::string> fired; // actions that fired, for the request log
};

class FaultTable {
public:
    // Adds a rule from its fields (kind, action, nth, times and the action's parameter).
    // Returns its id, or -1 with *error naming what is wrong.
    int add(const Fields &fields, std::string *error);
    // Counts one request of this kind against every rule and merges the effects of those
    // that fire. Admin requests are never counted.
    FaultEffects take(Kind kind);
    void clear();
    // The rules with their counters, as a JSON array.
    std::string to_json();

private:
    struct Rule {
        int id = 0;
        std::string kind;   // a kind name or "any"
        std::string action; // status, cut, throttle, stall, nolocation, bigheader
        int64_t nth = 1;    // the first request that fires, counted from 1 since the rule was added
        int64_t times = 1;  // how many requests fire from there on; 0: all
        int status = 0;
        std::string body;
        bool has_body = false;
        int64_t bytes = 0;
        double rate = 0;
        double seconds = 0;
        int64_t seen = 0;
        int64_t fired = 0;
    };

    std::mutex mutex_;
    std::vector<Rule> rules_;
    int next_id_ = 1;
};

} // namespace zv_devserver
