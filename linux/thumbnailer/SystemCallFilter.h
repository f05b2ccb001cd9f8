#pragma once

namespace skein::thumbnailer {

// From now on every thread of the process may read, write, send and receive on the
// descriptors that it has, manage memory that is not executable, start threads, and end; with
// `mayOpen` also open for reading what is not forbidden otherwise. Whatever else is asked of the
// system fails with EPERM: sockets, processes, signals to others, what a file is that was not
// opened. For good. 0, or an errno; the process must have given up new privileges.
int filterSystemCalls(bool mayOpen);

}  // namespace skein::thumbnailer
