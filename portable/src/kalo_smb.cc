#include "kalo/kalo_smb.h"

#include <json/json.h>
#include <sys/stat.h>
#include <syslog.h>

#include <cerrno>
#include <cstring>
#include <memory>
#include <sstream>
#include <string>

#include "kalo/kalo_error.h"
#include "kalo_log.h"
#include "orvex/portable/atomic_file.h"
#include "orvex/portable/root.h"

namespace {

constexpr char kSpotlightKey[] = "spotlight";

std::string SettingsPath() { return orvex::portable::RootPath(kSMBSettingsPath); }

// The settings as stored: an empty object when there is no file yet. False
// for a file that exists but is unreadable or not a JSON object: such a file
// is somebody's to repair, never silently replaced.
bool LoadSettings(const std::string& path, Json::Value& settings) {
  settings = Json::Value(Json::objectValue);
  std::string text;
  if (!orvex::portable::ReadWholeFile(path, text)) {
    if (errno == ENOENT) return true;
    KALO_LOG(LOG_ERR, "cannot read %s: %s", path.c_str(), std::strerror(errno));
    return false;
  }
  Json::CharReaderBuilder builder;
  std::string errors;
  std::istringstream in(text);
  if (!Json::parseFromStream(builder, in, &settings, &errors) || !settings.isObject()) {
    KALO_LOG(LOG_ERR, "%s is not a JSON object", path.c_str());
    return false;
  }
  return true;
}

}  // namespace

int KALOSMBIsEnableSpotlight() {
  Json::Value settings;
  if (!LoadSettings(SettingsPath(), settings)) {
    KLIBC_ERR_SET(KLIB_ERR_IO);
    return -1;
  }
  const Json::Value& value = settings[kSpotlightKey];
  if (value.isNull()) return 0;
  if (!value.isBool()) {
    KLIBC_ERR_SET(KLIB_ERR_IO);
    return -1;
  }
  return value.asBool() ? 1 : 0;
}

int KALOSMBSetSpotlight(int on) {
  const std::string path = SettingsPath();
  Json::Value settings;
  if (!LoadSettings(path, settings)) {
    KLIBC_ERR_SET(KLIB_ERR_IO);
    return -1;
  }
  settings[kSpotlightKey] = on != 0;
  Json::StreamWriterBuilder writer;
  writer["indentation"] = "  ";
  // A fresh root has no /etc/orvex yet; a failure shows in the write below.
  orvex::portable::MakeDirectories(path.substr(0, path.rfind('/')));
  if (!orvex::portable::WriteFileAtomic(path, Json::writeString(writer, settings) + "\n")) {
    KALO_LOG(LOG_ERR, "cannot write %s: %s", path.c_str(), std::strerror(errno));
    KLIBC_ERR_SET(KLIB_ERR_IO);
    return -1;
  }
  return 0;
}
