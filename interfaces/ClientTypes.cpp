#include "interfaces/ClientTypes.h"

namespace telvane {
namespace {

constexpr std::array<ClientType, kLastClientType - kFirstClientType + 1> kClientTypes = {{
    {5, "gaming", "GAMING"},
    {6, "media", "MEDIA"},
    {7, kConferencingStorebagName, "CONFERENCE"},
    {8, "audio", "AUDIO"},
    {9, "camera", "CAMERA"},
    {10, "display", "DISPLAY"},
    {11, kConferencingStorebagName, "CALLING"},
    {12, "assistant", "ASSISTANT"},
    {13, kConferencingStorebagName, "MESSAGING"},
    {14, "media", "STREAMING"},
    {15, "media", "PLAYBACK"},
    {16, "accessory", "ACCESSORY"},
    {17, "location", "LOCATION"},
    {18, "wireless", "WIRELESS"},
    {19, "storage", "STORAGE"},
    {20, kConferencingStorebagName, "SHARING"},
    {21, "graphics", "GRAPHICS"},
    {22, "health", "HEALTH"},
    {23, "home", "HOME"},
    {24, "input", "INPUT"},
    {25, "power", "POWER"},
    {26, "photos", "PHOTOS"},
    {27, "speech", "SPEECH"},
    {28, "system", "SYSTEM"},
    {29, "update", "UPDATE"},
    {30, "web", "WEB"},
}};

}  // namespace

const ClientType* clientType(int32_t number) noexcept {
  if (number < kFirstClientType || number > kLastClientType) return nullptr;
  return &kClientTypes[static_cast<size_t>(number - kFirstClientType)];
}

const std::array<ClientType, kLastClientType - kFirstClientType + 1>& allClientTypes() noexcept { return kClientTypes; }

bool hasWirelessDiagnostics(int64_t number) noexcept { return number == 7 || number == 11 || number == 13; }

}  // namespace telvane
