#pragma once

#include "platform/value/Error.h"

#include <string>

namespace kvr::client {

/// What the program ends with.
enum Status { kFine = 0, kFailed = 1, kNothingKnown = 2, kUnreachable = 3, kRefused = 4 };

/// One line on standard error, under the program's name.
void say(const std::string& message);

/// Says what went wrong and what helps; the status that goes with it.
Status fail(const Error& error);

/// Writes all of a text to standard output; `status`, or what a failure of that makes of it.
Status print(const std::string& text, Status status);
Status print(const Result<std::string>& text, Status status);

/// What a person can do about an error of the client; empty when nothing is known to help.
std::string cureFor(const Error& error);

}  // namespace kvr::client
