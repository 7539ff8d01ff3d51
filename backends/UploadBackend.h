#pragma once

#include <memory>
#include <optional>
#include <string>

#include "backends/TelvaneBackend.h"
#include "platform/SandboxExtensions.h"
#include "util/RunningUploads.h"

namespace telvane {

// A server that takes whole log files, which clients hand over with the right to read them. Events are none of its
// business: it keeps the base's operations for them, and is enabled from the start.
//
// Made by initWithName through the factory; threads as in the base. An upload blocks its caller until the server has
// answered, or until it is clear that it cannot; the answer comes on the connectivity helper's queue, so the caller
// must be another one. The file is read and compressed into a temporary file first, in pieces; no part of it waits in
// memory.
//
// At most RunningUploads::kMostAtOnce uploads run in the process at once, log data among them; one more is refused.
// When the process is to end, those that wait for their server wait no more, and their files stay.
//
// A client's file is deleted when the server's answer contains "success", wherever in it, and stays in every other
// case. docs/upload-protocol.md has the request in bytes.
class UploadBackend final : public TelvaneBackend {
 public:
  // Null, with an error line, without a URL to post to.
  static std::shared_ptr<UploadBackend> initWithName(const ProcessContext& context, const String& name,
                                                     const Value& profile, const std::optional<String>& productFamily);

  // Returns whether the file was taken: it is a regular one, not empty, and was posted, however that ended.
  bool uploadFileAtPath(const String& path, const ExtensionToken& extensionToken) override;

 private:
  UploadBackend(const ProcessContext& context, String name, Dictionary profile, String productFamily, String uploadURL);

  // Writes the error line, and returns false.
  bool refuseForLackOfRoom() const;
  // Nothing, with an error line where there is one to write, when the file is refused. size: of the file, when a place
  // was taken for it.
  std::optional<URLRequest> newRequest(const String& path, const SandboxExtension& extension, uint64_t size,
                                       const RunningUploads::Place& place) const;
  std::string requestURL(const String& path) const;
  void answered(const Data& data, SandboxExtension& extension, const String& path) const;

  const String _uploadURL;
};

}  // namespace telvane
