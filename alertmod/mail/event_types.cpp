#include "alertmod/mail/event_types.h"

#include <map>

namespace hx {

const std::string& EventTypeName(int32_t code) {
  static const std::map<int32_t, std::string> names = {
      {0, "Invalid"},
      {1, "Video Loss"},
      {2, "Video Motion"},
      {3, "Input Trigger"},
      {4, "Pos Port"},
      {5, "Pos Profile"},
      {6, "Button"},
      {7, "Temperature"},
      {8, "Storage"},
      {9, "IP Connection"},
      {10, "Record Content Age"},
      {11, "Archive Content Age"},
      {12, "Source Group"},
      {13, "Power Supply"},
      {14, "Outbound Connection"},
      {15, "Security Integrations Health"},
      {16, "Soft Trigger"},
      {17, "License"},
      {18, "Analytic"},
      {19, "Device Failure"},
      {20, "Audio Connection"},
      {21, "Device Connection"},
      {22, "Throttle"},
      {23, "Fan"},
      {24, "Time Trigger"},
      {25, "Hardware Temperature"},
      {26, "Hardware Fan"},
      {27, "Hardware Voltage"},
      {28, "Archive Connection"},
      {29, "Archive Task"},
      {30, "Security Integration Connection"},
      {31, "Security Integration Alarm"},
      {32, "Security Integration Alert"},
      {33, "Serial Port Connection"},
      {34, "Record Alarm"},
      {35, "Thinning"},
  };
  static const std::string unknown = "Unknown";
  auto found = names.find(code);
  return found == names.end() ? unknown : found->second;
}

const std::set<int32_t>& SystemHealthEventTypes() {
  static const std::set<int32_t> types = {8, 10, 11, 17, 22, 25, 26, 27, 28, 29, 35};
  return types;
}

const std::set<int32_t>& DeviceHealthEventTypes() {
  static const std::set<int32_t> types = {7, 13, 19, 23};
  return types;
}

bool IsCameraEventType(int32_t code) {
  return code == 1 || code == 2 || code == 9 || code == 18;
}

}  // namespace hx
