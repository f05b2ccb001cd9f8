#include "linux/vald/thumbnails/RenderWorker.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/mman.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <sys/wait.h>

#include <algorithm>
#include <cerrno>
#include <csignal>
#include <cstring>
#include <ctime>
#include <utility>

#include "linux/protocol/ProcessLauncher.h"
#include "linux/protocol/SpawnSettings.h"
#include "linux/rendering/PacketSocket.h"
#include "linux/vald/cloud/CloudErrors.h"
#include "linux/vald/thumbnails/RenderErrors.h"

namespace skein::vald {
namespace {

using Clock = std::chrono::steady_clock;

constexpr int kWorkerSocket = 3;
// A document that takes a process over can forge the pictures of those that come after it, and
// see them; so these are few.
constexpr std::uint64_t kMostJobs = 8;
constexpr std::uint64_t kMostSeconds = kWorkerSeconds / 2;

// Nothing of this process's own surroundings, which may name files to load.
constexpr const char* kEnvironment[] = {"LANG=C.UTF-8", "RAYON_NUM_THREADS=1", "MALLOC_ARENA_MAX=1",
                                        nullptr};

int spawn(const std::string& program, int socket, bool keepsStandardError, pid_t& process) {
  SpawnSettings settings;
  // In a group of its own, away from a terminal's signals, but in this process's session: how
  // nice a process is counts only among those of its session.
  posix_spawnattr_setflags(&settings.attributes,
                           POSIX_SPAWN_SETPGROUP | POSIX_SPAWN_SETSIGMASK | POSIX_SPAWN_SETSIGDEF);
  posix_spawn_file_actions_addopen(&settings.actions, STDIN_FILENO, "/dev/null", O_RDONLY, 0);
  posix_spawn_file_actions_addopen(&settings.actions, STDOUT_FILENO, "/dev/null", O_WRONLY, 0);
  if (!keepsStandardError) {
    posix_spawn_file_actions_adddup2(&settings.actions, STDOUT_FILENO, STDERR_FILENO);
  }
  posix_spawn_file_actions_adddup2(&settings.actions, socket, kWorkerSocket);
  posix_spawn_file_actions_addclosefrom_np(&settings.actions, kWorkerSocket + 1);
  posix_spawn_file_actions_addchdir_np(&settings.actions, "/");
  char* arguments[] = {const_cast<char*>(program.c_str()), nullptr};
  return posix_spawn(&process, program.c_str(), &settings.actions, &settings.attributes, arguments,
                     const_cast<char**>(kEnvironment));
}

std::uint64_t processorSeconds(pid_t process) {
  clockid_t clock{};
  timespec used{};
  if (clock_getcpuclockid(process, &clock) != 0 || clock_gettime(clock, &used) != 0) return 0;
  return static_cast<std::uint64_t>(used.tv_sec);
}

NSErrorPtr notStarted(const std::string& program, const std::string& why) {
  return renderError(RenderFailure::WorkerNotStarted,
                     "Pictures can't be drawn: " + program + " " + why + ".");
}

Outcome<RenderedPicture> pictureIn(int file, const RenderAnswer& answer) {
  RenderedPicture picture{answer.format, answer.width, answer.height, {}};
  picture.bytes.resize(answer.length);
  std::size_t done = 0;
  while (done < picture.bytes.size()) {
    const ssize_t length = pread(file, picture.bytes.data() + done, picture.bytes.size() - done,
                                 static_cast<off_t>(done));
    if (length < 0 && errno == EINTR) continue;
    if (length <= 0) return renderErrorOf(RenderStatus::Failed, PictureKind::Jpeg);
    done += static_cast<std::size_t>(length);
  }
  return picture;
}

}  // namespace

Outcome<std::shared_ptr<RenderWorker>> RenderWorker::start(Options options) {
  if (options.program.empty()) options.program = folderOfThisProgram() + "/skein-thumbnailer";
  int sockets[2];
  if (socketpair(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0, sockets) != 0) {
    return notStarted(options.program, std::string("has no socket: ") + std::strerror(errno));
  }
  FileDescriptor own(sockets[0]);
  FileDescriptor others(sockets[1]);
  pid_t process = 0;
  if (const int code = spawn(options.program, others.get(), options.keepsStandardError, process)) {
    return notStarted(options.program, std::string("cannot be run: ") + std::strerror(code));
  }
  others.reset();  // now the worker's end alone keeps the socket open
  std::shared_ptr<RenderWorker> worker(
      new RenderWorker(std::move(options), process, std::move(own)));
  if (NSErrorPtr error = worker->awaitGreeting()) return error;
  return worker;
}

RenderWorker::~RenderWorker() { end(); }

int RenderWorker::await(std::chrono::milliseconds patience, Packet& packet) {
  const auto deadline = Clock::now() + patience;
  for (;;) {
    const auto left =
        std::chrono::duration_cast<std::chrono::milliseconds>(deadline - Clock::now());
    pollfd wanted{_socket.get(), POLLIN, 0};
    const int ready = poll(&wanted, 1, static_cast<int>(std::max<std::int64_t>(left.count(), 0)));
    if (ready > 0) return receivePacket(_socket.get(), packet);
    if (ready == 0) return ETIMEDOUT;
    if (errno != EINTR) return errno;
  }
}

NSErrorPtr RenderWorker::awaitGreeting() {
  Packet packet;
  const int code = await(_options.patienceAtStart, packet);
  if (code == ETIMEDOUT) return notStarted(_options.program, "was not ready in time");
  const auto greeting = code == 0 ? parseGreeting(packet.bytes()) : std::nullopt;
  if (!greeting) {
    // In the worker's own words, which nobody has to believe.
    std::string why = code == 0 ? std::string(packet.bytes()) : std::string(std::strerror(code));
    std::erase_if(why, [](char c) { return c < ' ' || c > '~'; });
    return notStarted(_options.program, "could not be locked down: " + why);
  }
  _greeting = *greeting;
  return nullptr;
}

void RenderWorker::limitProcessorTime() {
  rlimit limit{};
  if (prlimit(_process, RLIMIT_CPU, nullptr, &limit) != 0) return;
  // Seconds that have begun do not count as used.
  const auto seconds = static_cast<std::uint64_t>(_options.processorTime.count());
  limit.rlim_cur = std::min<rlim_t>(processorSeconds(_process) + 1 + seconds, limit.rlim_max);
  prlimit(_process, RLIMIT_CPU, &limit, nullptr);
}

Outcome<RenderedPicture> RenderWorker::render(const Job& job, Cancellation& cancellation) {
  if ((_greeting.kinds & 1U << static_cast<unsigned>(job.kind)) == 0) {
    return renderErrorOf(RenderStatus::Unsupported, job.kind);
  }
  const FileDescriptor output(memfd_create("skein-picture", MFD_CLOEXEC));
  if (!output) return renderErrorOf(RenderStatus::Failed, job.kind);
  std::uint64_t number = 0;
  {
    MutexLock lock(_mutex);
    number = ++_job;
  }
  limitProcessorTime();
  // The handler may come late, when the next job has begun already.
  cancellation.setHandler([worker = weak_from_this(), number] {
    if (const auto self = worker.lock()) self->interrupt(number);
  });
  RenderRequest request;
  request.kind = job.kind;
  request.format = job.format;
  request.side = job.side;
  Packet packet;
  int code = sendPacket(_socket.get(), packetOf(request), {job.document, output.get()});
  if (code == 0) code = await(_options.patience, packet);
  cancellation.setHandler(nullptr);
  {
    MutexLock lock(_mutex);
    ++_job;
  }

  const auto answer = code == 0 ? parseRenderAnswer(packet.bytes()) : std::nullopt;
  if (!answer) {
    const int status = end();
    if (cancellation.isCancelled()) return cancelledError();
    if (code == ETIMEDOUT) {
      return renderError(RenderFailure::NotInTime,
                         "The document was not drawn in time; try again when less is going on.");
    }
    return endingError(status);
  }
  if (cancellation.isCancelled()) return cancelledError();
  if (answer->status != RenderStatus::Drawn) return renderErrorOf(answer->status, job.kind);
  return pictureIn(output.get(), *answer);
}

NSErrorPtr RenderWorker::endingError(int status) const {
  if (WIFSIGNALED(status) && WTERMSIG(status) == SIGXCPU) {
    return renderError(RenderFailure::TookTooLong,
                       "Drawing the document took more than " +
                           std::to_string(_options.processorTime.count()) +
                           " s of the processor's time.");
  }
  const std::string how = WIFSIGNALED(status) ? "signal " + std::to_string(WTERMSIG(status))
                                              : "status " + std::to_string(WEXITSTATUS(status));
  return renderError(RenderFailure::EndedWorker,
                     "Drawing the document ended its process (" + how + ").");
}

void RenderWorker::interrupt(std::uint64_t job) {
  MutexLock lock(_mutex);
  if (_job == job && !_reaped) kill(_process, SIGKILL);
}

int RenderWorker::end() {
  MutexLock lock(_mutex);
  if (_reaped) return 0;
  // One that is ending by itself already keeps the status of that.
  kill(_process, SIGKILL);
  int status = 0;
  while (waitpid(_process, &status, 0) < 0 && errno == EINTR) {
  }
  _reaped = true;
  return status;
}

bool RenderWorker::isUsable() {
  {
    MutexLock lock(_mutex);
    if (_reaped || _job >= 2 * kMostJobs) return false;
  }
  // It says nothing by itself: what can be read is the end.
  pollfd wanted{_socket.get(), POLLIN, 0};
  return poll(&wanted, 1, 0) == 0 && processorSeconds(_process) < kMostSeconds;
}

}  // namespace skein::vald
