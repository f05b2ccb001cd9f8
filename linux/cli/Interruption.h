#pragma once

#include <string>

namespace skein::cli {

// Signals that end a command (Ctrl-C, a closed terminal, a polite kill) end it at once, with
// exit code 128 + signal. What it began in skein-host ends with its connection.
void installInterruption();

// Whether the terminal's last line is still open; it is ended before such an end.
void setLineIsOpen(bool isOpen);

// A file alone in a folder of its own, both removed when the command ends so. One at a time;
// paths up to 4 kB. forgetTemporaryFile() when it is gone.
void rememberTemporaryFile(const std::string& folder, const std::string& file);
void forgetTemporaryFile();

}  // namespace skein::cli
