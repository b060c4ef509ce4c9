#include "programs/fileindexctl/application.h"

#include <unistd.h>

#include <exception>
#include <ostream>

#include "common/error.h"
#include "programs/fileindexctl/command_line.h"
#include "programs/fileindexctl/error_text.h"
#include "programs/fileindexctl/text.h"

namespace quivra::ctl {
namespace {

/// The one place where a failure is worded for the terminal. What an error is about may be hostile,
/// so that the sentence is escaped even where the output is not.
int Complain(Session& session, const std::string& sentence, int status) {
    session.err << "fileindexctl: " << Shown(sentence) << "\n";
    return status;
}

/// Help and version go to the output; everything else that the parser throws is a wrong call.
int AnswerParser(CommandLine& line, Session& session, const CLI::Error& error) {
    if (error.get_exit_code() == static_cast<int>(CLI::ExitCodes::Success)) {
        return line.Root().exit(error, session.out, session.err);
    }
    return Complain(session, std::string(error.what()) + "; see 'fileindexctl --help'", kWrongCall);
}

/// Nothing may leave the program as an exception: a script sees a status and a sentence.
int RunAction(const Action& action, Session& session) {
    try {
        return action(session);
    } catch (const Error& error) {
        return Complain(session, DescribeError(session.doing, error), kFailure);
    } catch (const Failure& failure) {
        return Complain(session, failure.what(), kFailure);
    } catch (const WrongCall& wrong_call) {
        return Complain(session, wrong_call.what(), kWrongCall);
    } catch (const std::exception& error) {
        return Complain(session, "cannot " + session.doing + ": " + error.what(), kFailure);
    }
}

}  // namespace

int Run(const std::vector<std::string>& arguments, Session& session) {
    CommandLine line;
    try {
        const Chosen chosen = line.Parse(arguments);
        session.json = line.WantsJson();
        // Before a lock is touched: whoever may not write must not leave a lock file behind, nor
        // wait for one.
        if (chosen.rights == Rights::kRoot && geteuid() != 0) {
            return Complain(session,
                            "cannot run '" + chosen.name + "': permission denied, run it as root",
                            kFailure);
        }
        return RunAction(chosen.action, session);
    } catch (const CLI::Error& error) {
        return AnswerParser(line, session, error);
    } catch (const WrongCall& wrong_call) {
        return Complain(session, wrong_call.what(), kWrongCall);
    }
}

}  // namespace quivra::ctl
