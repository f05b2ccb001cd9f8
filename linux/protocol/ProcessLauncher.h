#pragma once

#include <chrono>
#include <string>
#include <vector>

#include "linux/protocol/Deadlines.h"
#include "platform/foundation/NSError.h"

namespace skein {

// How to start one of the drive's programs.
struct ProgramToStart {
  std::string program;                 // "vald"
  std::vector<std::string> arguments;  // without the program's own name
  std::string socketPath;              // accepts connections once the program is ready
  std::string logPath;                 // takes its standard output and error
  // Where the program is; empty: where the running program is.
  std::string folder;
  std::chrono::milliseconds deadline{deadlines::kProgramStart};
};

// The folder of the running program's file; empty when the system does not tell.
std::string folderOfThisProgram();

// Makes sure that the program runs: answers null as soon as its socket accepts, at once
// when it does already. Otherwise starts it, in a session of its own and with no
// descriptor of this process, so that it outlives the terminal.
//
// Several processes may call this at once for the same program, because a program that
// finds its lock file held ends with status 0 and leaves the socket to the other one.
//
// Answers an error that names the program, the cause and where to look: it is missing, it
// ended (with the last line of its log), it was not ready by the deadline.
// VLVellumErrorDomain, VLVellumErrorDaemonUnreachable. Blocks; any thread but an I/O thread.
NSErrorPtr startProgram(const ProgramToStart& program);

}  // namespace skein
