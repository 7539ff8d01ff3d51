#include "platform/url/CurlLoop.h"

#include <curl/curl.h>
#include <sys/epoll.h>
#include <sys/eventfd.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <climits>
#include <system_error>

namespace telvane {

namespace {

int descriptorOrThrow(int descriptor, const char* what) {
  if (descriptor < 0) throw std::system_error(errno, std::generic_category(), what);
  return descriptor;
}

uint32_t interestFor(int events) {
  uint32_t interest = 0;
  if (events & CURL_POLL_IN) interest |= EPOLLIN;
  if (events & CURL_POLL_OUT) interest |= EPOLLOUT;
  return interest;
}

int selectBitsFor(uint32_t events) {
  int bits = 0;
  if (events & EPOLLIN) bits |= CURL_CSELECT_IN;
  if (events & EPOLLOUT) bits |= CURL_CSELECT_OUT;
  // The transfer finds out what is wrong when it reads or writes.
  if (events & (EPOLLERR | EPOLLHUP)) bits |= CURL_CSELECT_ERR | CURL_CSELECT_IN | CURL_CSELECT_OUT;
  return bits;
}

}  // namespace

CurlLoop::CurlLoop()
    : _epoll(descriptorOrThrow(epoll_create1(EPOLL_CLOEXEC), "epoll")),
      _wakeUpCall(descriptorOrThrow(eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK), "eventfd")) {
  // Edge-triggered: each call is an event of its own, so that nobody needs to read them.
  epoll_event event{.events = EPOLLIN | EPOLLET, .data = {.fd = _wakeUpCall}};
  epoll_ctl(_epoll, EPOLL_CTL_ADD, _wakeUpCall, &event);
}

CurlLoop::~CurlLoop() {
  stop();
  close(_wakeUpCall);
  close(_epoll);
}

void CurlLoop::post(Job job) {
  bool mustWake = false;
  {
    const MutexLock lock(_mutex);
    if (_isStopping) return;
    _jobs.push_back(std::move(job));
    if (!_thread) _thread = std::make_unique<Thread>("telvane-url", [this] { run(); });
    mustWake = std::exchange(_isSleeping, false);
  }
  if (mustWake) wake();
}

void CurlLoop::stop() {
  std::unique_ptr<Thread> thread;
  {
    const MutexLock lock(_mutex);
    _isStopping = true;
    thread = std::move(_thread);
    _isSleeping = false;
  }
  wake();
  // Letting go of the thread waits for it.
}

void CurlLoop::join(std::shared_ptr<Member> member) {
  Member* key = member.get();
  _members.try_emplace(key, Entry{.member = std::move(member)});
}

void CurlLoop::leave(Member& member) {
  setTimer(member, std::nullopt);
  noteChanged(member);
  if (const auto found = _members.find(&member); found != _members.end()) found->second.leaving = true;
}

void CurlLoop::watch(int socket, int events, Member& member) {
  epoll_event event{.events = interestFor(events), .data = {.fd = socket}};
  const auto [watch, isNew] = _watches.try_emplace(socket, &member);
  watch->second = &member;
  // A socket that was closed unseen has left the epoll set by itself, and its number may have come back.
  if (epoll_ctl(_epoll, isNew ? EPOLL_CTL_ADD : EPOLL_CTL_MOD, socket, &event) == 0) return;
  epoll_ctl(_epoll, isNew ? EPOLL_CTL_MOD : EPOLL_CTL_ADD, socket, &event);
}

void CurlLoop::unwatch(int socket) {
  if (_watches.erase(socket) == 0) return;
  epoll_event ignored{};
  epoll_ctl(_epoll, EPOLL_CTL_DEL, socket, &ignored);
}

void CurlLoop::setTimer(Member& member, std::optional<std::chrono::milliseconds> delay) {
  const auto found = _members.find(&member);
  if (found == _members.end()) return;
  Entry& entry = found->second;
  if (entry.timer) _timers.erase({*entry.timer, &member});
  entry.timer = delay ? std::optional(std::chrono::steady_clock::now() + *delay) : std::nullopt;
  if (entry.timer) _timers.emplace(*entry.timer, &member);
}

void CurlLoop::noteChanged(Member& member) {
  const auto found = _members.find(&member);
  if (found == _members.end() || std::exchange(found->second.changed, true)) return;
  _changed.push_back(&member);
}

void CurlLoop::run() {
  while (runJobs()) {
    fireTimers();
    endTurn();
    waitForSockets();
  }
  endTurn();
  endMembers();
}

bool CurlLoop::runJobs() {
  std::vector<Job> jobs;
  bool isStopping = false;
  {
    const MutexLock lock(_mutex);
    jobs.swap(_jobs);
    isStopping = _isStopping;
  }
  for (Job& job : jobs) job();
  return !isStopping;
}

void CurlLoop::fireTimers() {
  if (_timers.empty()) return;
  const Time now = std::chrono::steady_clock::now();
  std::vector<Member*> due;
  for (const auto& [time, member] : _timers) {
    if (time > now) break;
    due.push_back(member);
  }
  for (Member* member : due) {
    setTimer(*member, std::nullopt);
    noteChanged(*member);
    member->timerFired();
  }
}

void CurlLoop::endTurn() {
  // Ending a turn may change a member again (a completed transfer lets a waiting one start): that is the next turn's.
  const std::vector<Member*> changed = std::exchange(_changed, {});
  for (Member* member : changed) _members.at(member).changed = false;
  for (Member* member : changed) member->turnEnded();
  for (Member* member : changed) {
    const auto found = _members.find(member);
    if (!found->second.leaving) continue;
    std::erase(_changed, member);
    _members.erase(found);
  }
}

void CurlLoop::endMembers() {
  while (!_members.empty()) {
    const std::shared_ptr<Member> member = _members.begin()->second.member;
    member->loopEnded();
    setTimer(*member, std::nullopt);
    _members.erase(member.get());
  }
}

void CurlLoop::waitForSockets() {
  int timeout = _changed.empty() ? millisecondsToSleep() : 0;
  {
    const MutexLock lock(_mutex);
    if (!_jobs.empty() || _isStopping) timeout = 0;
    _isSleeping = timeout != 0;
  }
  std::array<epoll_event, 64> events;
  const int count = epoll_wait(_epoll, events.data(), static_cast<int>(events.size()), timeout);
  {
    const MutexLock lock(_mutex);
    _isSleeping = false;
  }
  for (int i = 0; i < count; ++i) socketIsReady(events[i].data.fd, events[i].events);
}

int CurlLoop::millisecondsToSleep() const {
  if (_timers.empty()) return -1;
  const auto remaining = _timers.begin()->first - std::chrono::steady_clock::now();
  const auto milliseconds = std::chrono::ceil<std::chrono::milliseconds>(remaining).count();
  return static_cast<int>(std::clamp<int64_t>(milliseconds, 0, INT_MAX));
}

void CurlLoop::socketIsReady(int socket, uint32_t events) {
  if (socket == _wakeUpCall) return;
  const auto found = _watches.find(socket);  // may have gone with what an earlier socket of this turn brought
  if (found == _watches.end()) return;
  Member* member = found->second;
  noteChanged(*member);
  member->socketReady(socket, selectBitsFor(events));
}

void CurlLoop::wake() const {
  const uint64_t one = 1;
  [[maybe_unused]] const ssize_t size = write(_wakeUpCall, &one, sizeof one);
}

}  // namespace telvane
