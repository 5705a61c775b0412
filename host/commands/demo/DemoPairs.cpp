#include "host/commands/demo/DemoPairs.h"

#include <poll.h>
#include <signal.h>

#include <memory>
#include <regex>

#include <korvo/platform/Routes.h>

#include "host/base/Interrupt.h"
#include "host/core/ChildProcess.h"
#include "host/output/JsonEvent.h"
#include "host/output/Output.h"

namespace korvo {
namespace host {

namespace {

struct Pair {
    ChildProcess demo;
    bool open = false;
    int status = -1;
    int completed = -1;  // from its summary
    int rounds = 0;
    int foreign = 0;
};

// A pair's summary, in whichever form it printed it.
void readSummary(const std::string& line, Pair* p) {
    static const std::regex human(R"((\d+) of (\d+) exchanges? completed.*; (\d+) codes? heard before this pair said)");
    static const std::regex json(R"("event":"summary","rounds":(\d+),"completed":(\d+),"foreign":(\d+))");
    std::smatch m;
    if (std::regex_search(line, m, human)) {
        p->completed = std::stoi(m[1]), p->rounds = std::stoi(m[2]), p->foreign = std::stoi(m[3]);
    } else if (std::regex_search(line, m, json)) {
        p->rounds = std::stoi(m[1]), p->completed = std::stoi(m[2]), p->foreign = std::stoi(m[3]);
    }
}

// A pair's line as the user sees it: its number in front, or in its JSON object.
void forward(int pair, const std::string& line) {
    if (outputMode() == OutputMode::Json && !line.empty() && line[0] == '{') {
        outf("{\"pair\":%d,%s\n", pair, line.substr(1).c_str());
    } else {
        outf("pair %d  %s\n", pair, line.c_str());
    }
}

}  // namespace

int runPairs(const PairsPlan& plan) {
    std::vector<std::unique_ptr<Pair>> pairs;
    ChildProcess::Options options;
    options.ownGroup = true;  // Ctrl-C reaches this process, which stops the pairs in order
    options.nullStdin = true;
    options.captureStderr = true;
    for (const std::vector<std::string>& args : plan.demos) {
        pairs.push_back(std::make_unique<Pair>());
        std::string error;
        if (!pairs.back()->demo.start(selfExecutable(), args, {}, options, &error)) {
            errf("cannot start pair %zu: %s", pairs.size(), error.c_str());
            pairs.pop_back();
            break;
        }
        pairs.back()->open = true;
    }
    bool stopping = false;
    for (;;) {
        if (interrupted() && !stopping) {
            for (auto& p : pairs) p->demo.sendSignal(SIGTERM);
            stopping = true;
        }
        std::vector<pollfd> fds;
        std::vector<size_t> which;
        for (size_t i = 0; i < pairs.size(); ++i) {
            if (!pairs[i]->open) continue;
            fds.push_back({pairs[i]->demo.stdoutFd(), POLLIN, 0});
            which.push_back(i);
        }
        if (fds.empty()) break;
        if (poll(fds.data(), fds.size(), 100) <= 0) continue;
        for (size_t k = 0; k < fds.size(); ++k) {
            if (fds[k].revents == 0) continue;
            Pair& p = *pairs[which[k]];
            // Its lines end with its standard output; its standard error may stay open a little
            // longer, in a device that is still leaving (read to its end below).
            if (!p.demo.pump(0) || p.demo.stdoutFd() < 0) p.open = false;
            for (const std::string& line : p.demo.takeLines()) {
                readSummary(line, &p);
                forward(static_cast<int>(which[k]) + 1, line);
            }
        }
    }
    int allDone = 0, foreign = 0;
    bool failed = pairs.size() != plan.demos.size();
    for (size_t i = 0; i < pairs.size(); ++i) {
        Pair& p = *pairs[i];
        for (int k = 0; k < 50 && p.demo.pump(100);) ++k;  // the rest of its errors, 5 s at most
        if (!p.demo.wait(30000, &p.status)) {
            p.demo.sendSignal(SIGKILL);
            p.demo.wait(5000, &p.status);
        }
        // Its errors, one line each, with the pair's number.
        std::string err = p.demo.err();
        for (size_t at = 0; at < err.size();) {
            const size_t end = err.find('\n', at);
            std::string line = err.substr(at, end == std::string::npos ? std::string::npos : end - at);
            if (line.compare(0, 12, "soundmeter: ") == 0) line = line.substr(12);
            if (!line.empty()) errf("pair %zu: %s", i + 1, line.c_str());
            at = end == std::string::npos ? err.size() : end + 1;
        }
        allDone += p.status == 0 && p.completed == p.rounds;
        foreign += p.foreign;
        failed = failed || p.status != 0;
    }
    // The room goes with its last member: joining and leaving once more removes it when a
    // pair could not leave in order.
    korvo::platform::makeCaptureRoute("sim:" + plan.room, nullptr);
    JsonEvent summary("pairs");
    summary.add("pairs", static_cast<int>(plan.demos.size())).add("completed_every_exchange", allDone).add("foreign", foreign);
    resultf(summary, "%s: %d completed every exchange; devices heard %s before their own peer said them\n",
            plural(static_cast<long long>(plan.demos.size()), "pair").c_str(), allDone, plural(foreign, "code").c_str());
    if (interrupted()) return 130;
    return failed ? 1 : 0;
}

}  // namespace host
}  // namespace korvo
