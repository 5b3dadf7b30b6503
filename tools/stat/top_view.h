// The live view, korvsnmp-stat --top: a full screen in the manner of top
// and iostat, drawn with ncurses from the lines of top_layout.h.
#ifndef KORVSNMP_STAT_TOP_VIEW_H
#define KORVSNMP_STAT_TOP_VIEW_H

#include <chrono>
#include <functional>
#include <string>

#include <json/value.h>

namespace korvstat {

// Takes one sample: true with `result` filled, or false with `error`
// saying what failed.
using Sampler = std::function<bool(Json::Value &result, std::string &error)>;

// Shows the samples that `sample` takes every `interval` until q, SIGINT
// or SIGTERM; returns the exit status: 0 then, 1 (with a message on
// standard error) when standard input and output are not a terminal or
// the sampler cannot be started.
//
// `sample` runs in a child process that sends each result through a pipe:
// a collector that stalls (the library waits for it up to its timeout)
// holds neither the keys nor a resize, and leaving stops the child by its
// process id at once. A failed sample is shown on the first line, the last
// good one staying on screen.
int RunTop(std::chrono::milliseconds interval, const Sampler &sample);

}  // namespace korvstat

#endif
