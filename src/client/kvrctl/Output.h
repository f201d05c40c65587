#pragma once

#include "platform/value/Error.h"

#include <string>

namespace kvr::client {

/// The program's exit statuses.
enum Status { kFine = 0, kFailed = 1, kNothingKnown = 2, kUnreachable = 3, kRefused = 4 };

/// Writes one line to standard error, prefixed with the program's name.
void say(const std::string& message);

/// Reports the error and what can be done about it; returns the matching exit status.
Status fail(const Error& error);

/// Writes a text to standard output. Returns `status`, or the status of a failure to write.
Status print(const std::string& text, Status status);
Status print(const Result<std::string>& text, Status status);

/// What the user can do about an error of the client; empty when no help is known.
std::string cureFor(const Error& error);

}  // namespace kvr::client
