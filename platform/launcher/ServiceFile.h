#pragma once

#include <cstdint>
#include <string>

#include "platform/os/Error.h"
#include "platform/value/Dictionary.h"

namespace launcher {

// The contents of one service file of the launcher's table: an XML property list
//   {"Executable": <absolute path of the plug-in's executable>, "Description": <dictionary>,
//    "HostStartTime": <when the host process started (os::Process::startTime)>}
// Stateless; safe to call from any thread.
class ServiceFile {
 public:
  struct Contents {
    std::string executablePath;
    value::Dictionary description;
    std::uint64_t hostStartTime = 0;
  };

  // |contents| as the text of a service file. Fails with EINVAL when a property list cannot
  // hold the path or the description (see value::PropertyList::toXml).
  static os::Result<std::string> encode(const Contents& contents);

  // The service file at |path|. Fails with the errno of reading it (ENOENT when it is missing),
  // or EINVAL when it is not a property list or lacks a string "Executable", a dictionary
  // "Description" or a non-negative integer "HostStartTime".
  static os::Result<Contents> read(const std::string& path);
};

}  // namespace launcher
