#include "platform/ipc/Outbox.h"

#include <utility>

namespace telvane::ipc {

Outbox::Admission Outbox::add(OutgoingCall& call, size_t wireBytes, size_t textBytes) {
  MutexLock lock(_mutex);
  if (_isClosed) return Admission::Closed;
  const size_t bytes = wireBytes + sizeof(OutgoingCall);
  if (_bytes + bytes > _limits.maximumWaitingBytes) {
    ++_dropped;
    return Admission::Full;
  }
  _bytes += bytes;
  auto& batch = batchFor(call, bytes);
  batch.memoryBytes += bytes;
  batch.wireBytes += wireBytes;
  batch.textBytes += textBytes;
  batch.descriptors += call.invocation.descriptor.isValid() ? 1 : 0;
  batch.calls.push_back(std::move(call));
  if (_wake == Wake::Never || (_wake == Wake::WhenFull && !isBatchFull())) return Admission::Queued;
  _wake = Wake::Never;
  return Admission::QueuedMustPump;
}

OutgoingBatch& Outbox::batchFor(const OutgoingCall& call, size_t memoryBytes) {
  if (!_batches.empty()) {
    auto& last = _batches.back();
    const size_t descriptors = last.descriptors + (call.invocation.descriptor.isValid() ? 1 : 0);
    if (last.calls.size() < _limits.maximumBatchCalls && last.memoryBytes + memoryBytes <= _limits.maximumBatchBytes &&
        descriptors <= _limits.maximumBatchDescriptors) {
      return last;
    }
  }
  auto& batch = _batches.emplace_back();
  if (_wake != Wake::AtOnce) batch.calls.reserve(_limits.maximumBatchCalls);
  return batch;
}

bool Outbox::isFull(const OutgoingBatch& batch) const {
  return batch.calls.size() >= _limits.maximumBatchCalls || batch.memoryBytes >= _limits.maximumBatchBytes;
}

bool Outbox::isBatchFull() const { return _batches.size() > 1 || (!_batches.empty() && isFull(_batches.front())); }

std::optional<OutgoingBatch> Outbox::take(size_t batchesUnderWay) {
  MutexLock lock(_mutex);
  if (batchesUnderWay >= _limits.maximumBatchesUnderWay) {
    _wake = Wake::Never;
    return std::nullopt;
  }
  if (_batches.empty() || (batchesUnderWay > 0 && !isBatchFull())) {
    _wake = batchesUnderWay == 0 ? Wake::AtOnce : Wake::WhenFull;
    return std::nullopt;
  }
  std::optional<OutgoingBatch> batch(std::move(_batches.front()));
  _batches.pop_front();
  return batch;
}

void Outbox::standStill() {
  MutexLock lock(_mutex);
  _wake = Wake::Never;
}

std::vector<OutgoingBatch> Outbox::takeAll() {
  MutexLock lock(_mutex);
  std::vector<OutgoingBatch> all;
  for (auto& batch : _batches) {
    _bytes -= batch.memoryBytes;
    all.push_back(std::move(batch));
  }
  _batches.clear();
  _wake = Wake::AtOnce;
  return all;
}

std::vector<OutgoingCall> Outbox::takeHandlers() {
  MutexLock lock(_mutex);
  std::vector<OutgoingCall> handlers;
  for (auto& batch : _batches) {
    for (auto& call : batch.calls) {
      if (!call.reply && !call.onError) continue;
      auto& taken = handlers.emplace_back();
      taken.reply = std::move(call.reply);
      taken.onError = std::move(call.onError);
    }
  }
  return handlers;
}

uint64_t Outbox::settle(size_t memoryBytes) {
  MutexLock lock(_mutex);
  _bytes -= memoryBytes;
  // A burst ends when there is room again for more than the next batch; else a steady overload would be a line per
  // batch.
  if (_dropped == 0 || _bytes > _limits.maximumWaitingBytes / 2) return 0;
  return std::exchange(_dropped, 0);
}

uint64_t Outbox::takeDropped() {
  MutexLock lock(_mutex);
  return std::exchange(_dropped, 0);
}

void Outbox::close() {
  MutexLock lock(_mutex);
  _isClosed = true;
}

bool Outbox::isEmpty() const {
  MutexLock lock(_mutex);
  return _batches.empty();
}

}  // namespace telvane::ipc
