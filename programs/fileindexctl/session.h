#pragma once

#include <iosfwd>
#include <stdexcept>
#include <string>

namespace quivra::ctl {

/// Exit statuses: what scripts rely on.
inline constexpr int kSuccess = 0;
inline constexpr int kFailure = 1;    ///< the command failed, or a search has no hit
inline constexpr int kWrongCall = 2;  ///< the command line itself is wrong: nothing was done

/// The surroundings of one command: where it writes and how. Borrows the streams.
struct Session {
    std::ostream& out;
    std::ostream& err;
    bool out_is_terminal = false;  ///< colours and bars
    unsigned int columns = 80;     ///< width and height of the terminal
    unsigned int rows = 24;
    bool json = false;  ///< one JSON document instead of text
    /// What is being attempted, "add /photo": the object of a failure's sentence.
    std::string doing{};
    /// A thread still hangs in the library: the process must end without waiting for it.
    bool given_up = false;
};

/// A failure of the front end itself; the text is the whole sentence. Exit status 1.
struct Failure : std::runtime_error {
    using std::runtime_error::runtime_error;
};

/// The command line asks for something that makes no sense. Exit status 2.
struct WrongCall : std::runtime_error {
    using std::runtime_error::runtime_error;
};

}  // namespace quivra::ctl
