#include "programs/fileindexctl/application.h"

#include <unistd.h>

#include <exception>
#include <ostream>

#include "common/error.h"
#include "fileindex/folder_mgr.h"
#include "programs/fileindexctl/command_line.h"
#include "programs/fileindexctl/completion.h"
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

void Replace(std::string& text, const std::string& from, const std::string& to) {
    const std::size_t found = text.find(from);
    if (found != std::string::npos) {
        text.replace(found, from.size(), to);
    }
}

/// The parser's sentences in the words of all others.
std::string DescribeWrongCall(const CLI::Error& error) {
    std::string text = error.what();
    if (text == "A subcommand is required") {
        return "a command is missing";
    }
    const std::string subject = text.substr(text.find(": ") + 2);
    if (text.starts_with("Could not convert: ")) {
        return subject + " is not a number that fits";
    }
    if (text.starts_with("The following argument")) {
        return subject + " is not expected here";
    }
    if (text.ends_with(" missing")) {
        return text.substr(0, text.find(": ")) + " needs a value";
    }
    Replace(text, " not in {", " is not one of ");
    Replace(text, "}", "");
    return text;
}

/// Help and version go to the output; everything else that the parser throws is a wrong call.
int ReportParser(CommandLine& line, const std::vector<std::string>& arguments, Session& session,
                 const CLI::Error& error) {
    if (error.get_exit_code() == static_cast<int>(CLI::ExitCodes::Success)) {
        return line.Root().exit(error, session.out, session.err);
    }
    return Complain(session,
                    DescribeWrongCall(error) + "; see '" + line.CallOf(arguments) + " --help'",
                    kWrongCall);
}

/// The library names the share that is gone, whatever the command was about: as long as its folders
/// are in the set, each question about a path may come by them.
std::string DescribeFailure(const std::string& doing, const Error& error) {
    if (error.code == Error::kNoSuchShare && fileindex::FolderMgr().IsShareIndexed(error.reason)) {
        return "cannot " + doing + ": share " + error.reason +
               ", which has indexed folders, is gone; bring it back, or forget it with "
               "'fileindexctl share clear " +
               error.reason +
               " PATH', where PATH is the root that "
               "it had [" +
               std::to_string(static_cast<int>(error.code)) + "]";
    }
    return DescribeError(doing, error);
}

/// Nothing may leave the program as an exception: a script sees a status and a sentence.
int RunAction(const Action& action, Session& session) {
    try {
        return action(session);
    } catch (const Error& error) {
        return Complain(session, DescribeFailure(session.doing, error), kFailure);
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
    if (!arguments.empty() && arguments[0] == kCompleteOption) {
        Complete(line, {arguments.begin() + 1, arguments.end()}, session);
        return kSuccess;
    }
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
        return ReportParser(line, arguments, session, error);
    } catch (const WrongCall& wrong_call) {
        return Complain(session, wrong_call.what(), kWrongCall);
    }
}

}  // namespace quivra::ctl
