#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "foundation/Value.h"
#include "storebag/StorebagExplanation.h"

namespace telvane {

// The device, its user and the session that a storebag is explained for. Empty texts: there is none.
struct StorebagExplainCase {
  int32_t clientType = 5;
  std::string clientName;
  std::string serviceName;
  bool requiresUserInfo = true;
  bool batchesEvents = false;  // what the session asks for
  std::string country = "US";
  std::string productFamily = "Device";
  std::string hardware = "Device1,1";
  std::string frameworkVersion = "8.0";
  bool isInternal = false;
  bool hasConsent = true;
  double samplingFactor = 0;  // 0 to 0.9999, as a device draws it, in steps of 0.0001
  std::string environment;    // empty: as defaults and build have it
  Dictionary defaults;        // this user's settings of the suite com.corvex.telvane
};

// Everything that is to be told about one bag.
struct StorebagExplainReport {
  std::string file;
  bool isSigned = false;  // in an envelope, whose signature nobody has checked
  StorebagExplainCase situation;
  std::vector<std::string> assumed;  // options that were not given, as they would be given
  StorebagExplanation explanation;
};

}  // namespace telvane
