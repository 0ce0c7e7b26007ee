#include "alertmod/video/av_libs.h"

#include <atomic>
#include <cstdarg>
#include <cstdio>
#include <cstring>

#include "alertmod/diag/log.h"
#include "alertmod/platform/shared_library.h"

// Expanded over a library's symbol list inside its Resolve: every required
// symbol must be found for `resolved` to stay true; an optional one may be
// missing.
#define AV_BIND_REQUIRED(symbol) resolved &= Bind(#symbol, symbol);
#define AV_BIND_OPTIONAL(symbol) Bind(#symbol, symbol);

namespace hx {
namespace {

std::string LibraryPath(const std::string& directory, const char* baseName, int major) {
  std::string path = directory;
  if (!path.empty() && path.back() != '/') path.push_back('/');
  return path + platform::SharedLibraryFileName(baseName, major);
}

// The libraries' log callback is one per process and carries no context of
// ours, so the host it forwards to has to be found here.
std::atomic<core::HostCallbackFn> g_codecLogHost{nullptr};

// Forwards one message of the libraries. Their informational and debug
// messages are dropped, as their own printer drops them by default; the
// rest (for example a muxer's "reserved_moov_size is too small") goes to the
// host's log instead of the host's standard error.
void ForwardCodecLog(void* /*context*/, int level, const char* format, va_list arguments) {
  const core::HostCallbackFn host = g_codecLogHost.load();
  if (host == nullptr || format == nullptr || level > AV_LOG_WARNING) return;
  char text[kMaxLogTextLength + 1];
  va_list copy;
  va_copy(copy, arguments);
  const int written = vsnprintf(text, sizeof(text), format, copy);
  va_end(copy);
  if (written <= 0) return;
  size_t length = strnlen(text, sizeof(text));
  while (length > 0 && (text[length - 1] == '\n' || text[length - 1] == '\r')) --length;
  if (length == 0) return;
  text[length] = '\0';
  LogToHost(core::kModuleId, host, LogLevelWarning, "%s", text);
}

}  // namespace

LibWrapper::~LibWrapper() {
  platform::CloseSharedLibrary(m_module);
}

void LibWrapper::Unload() {
  BeforeUnload();
  platform::CloseSharedLibrary(m_module);
  AfterUnload();
  m_module = nullptr;
  m_loadedFile.clear();
  Resolve();
}

bool LibWrapper::LoadFile(const char* baseName, int builtMajor, const char* versionSymbol) {
  const std::string path = LibraryPath(m_directory, baseName, builtMajor);
  void* module = platform::OpenSharedLibrary(path);
  if (module == nullptr) return false;
  ReplaceModule(module, path);
  Resolve();
  if (!IsResolved()) return false;
  if (IsBuiltMajor(versionSymbol, builtMajor)) return true;
  // Its structures are laid out differently from what the module reads.
  ReplaceModule(nullptr, std::string());
  Resolve();
  return false;
}

template <typename Fn>
bool LibWrapper::Bind(const char* name, Fn& slot) {
  slot = reinterpret_cast<Fn>(platform::FindSharedSymbol(m_module, name));
  return slot != nullptr;
}

void LibWrapper::ReplaceModule(void* module, const std::string& file) {
  platform::CloseSharedLibrary(m_module);
  m_module = module;
  m_loadedFile = file;
}

bool LibWrapper::IsBuiltMajor(const char* versionSymbol, int builtMajor) const {
  using VersionFn = unsigned (*)();
  auto version = reinterpret_cast<VersionFn>(platform::FindSharedSymbol(m_module, versionSymbol));
  // FFmpeg packs a version as major << 16 | minor << 8 | micro.
  return version != nullptr && static_cast<int>(version() >> 16) == builtMajor;
}

bool AVCodecLib::Load() {
  return LoadFile("avcodec", LIBAVCODEC_VERSION_MAJOR, "avcodec_version");
}

void AVCodecLib::Resolve() {
  bool resolved = true;
  ALERTMOD_AVCODEC_SYMBOLS(AV_BIND_REQUIRED, AV_BIND_REQUIRED, AV_BIND_OPTIONAL)
  m_resolved = resolved && HasModule();
}

bool AVFormatLib::Load() {
  return LoadFile("avformat", LIBAVFORMAT_VERSION_MAJOR, "avformat_version");
}

void AVFormatLib::Resolve() {
  bool resolved = true;
  ALERTMOD_AVFORMAT_SYMBOLS(AV_BIND_REQUIRED, AV_BIND_REQUIRED, AV_BIND_OPTIONAL)
  m_resolved = resolved && HasModule();
}

bool AVUtilLib::Load() {
  return LoadFile("avutil", LIBAVUTIL_VERSION_MAJOR, "avutil_version");
}

void AVUtilLib::Resolve() {
  bool resolved = true;
  ALERTMOD_AVUTIL_SYMBOLS(AV_BIND_REQUIRED, AV_BIND_REQUIRED, AV_BIND_OPTIONAL)
  m_resolved = resolved && HasModule();
}

bool AVFilterLib::Load() {
  return LoadFile("avfilter", LIBAVFILTER_VERSION_MAJOR, "avfilter_version");
}

void AVFilterLib::Resolve() {
  bool resolved = true;
  ALERTMOD_AVFILTER_SYMBOLS(AV_BIND_REQUIRED, AV_BIND_REQUIRED, AV_BIND_OPTIONAL)
  m_resolved = resolved && HasModule();
}

bool SWResampleLib::Load() {
  return LoadFile("swresample", LIBSWRESAMPLE_VERSION_MAJOR, "swresample_version");
}

void SWResampleLib::Resolve() {
  bool resolved = true;
  ALERTMOD_SWRESAMPLE_SYMBOLS(AV_BIND_REQUIRED, AV_BIND_REQUIRED, AV_BIND_OPTIONAL)
  m_resolved = resolved && HasModule();
}

MultiLibWrapper::~MultiLibWrapper() = default;

bool MultiLibWrapper::LoadEach() {
  bool ok = !m_helpers.empty();
  for (auto& helper : m_helpers) ok &= helper->Load();
  return ok;
}

bool MultiLibWrapper::AllLoaded() const {
  if (m_helpers.empty()) return false;
  for (const auto& helper : m_helpers) {
    if (!helper->IsLoaded()) return false;
  }
  return true;
}

bool MultiLibWrapper::LoadAll() {
  if (AllLoaded()) return true;
  if (!LoadEach()) return false;
  AfterAllLoaded();
  return true;
}

bool MultiLibWrapper::Reload() {
  for (auto& helper : m_helpers) helper->Unload();
  return LoadAll();
}

av_init::av_init(const std::string& directory) {
  SetLibraryDirectory(directory);
  Register(static_cast<AVCodecLib*>(this));
  Register(static_cast<AVFormatLib*>(this));
  Register(static_cast<AVUtilLib*>(this));
  Register(static_cast<AVFilterLib*>(this));
  Register(static_cast<SWResampleLib*>(this));
  LoadAll();
}

av_init::~av_init() {
  if (m_routesLog) RouteLogTo(nullptr);
}

av_init& av_init::Instance() {
  // Made on first use rather than during static initialisation, so that a
  // machine without the libraries costs nothing until a clip is wanted.
  static av_init instance;
  return instance;
}

void av_init::SetLibraryDirectory(const std::string& directory) {
  AVCodecLib::SetDirectory(directory);
  AVFormatLib::SetDirectory(directory);
  AVUtilLib::SetDirectory(directory);
  AVFilterLib::SetDirectory(directory);
  SWResampleLib::SetDirectory(directory);
}

void av_init::RouteLogTo(core::HostCallbackFn host) {
  g_codecLogHost.store(host);
  m_routesLog = host != nullptr;
  InstallLogCallback();
}

void av_init::AfterAllLoaded() {
  if (AVFormatLib::av_register_all != nullptr) AVFormatLib::av_register_all();
  if (AVFilterLib::avfilter_register_all != nullptr) AVFilterLib::avfilter_register_all();
  if (m_routesLog) InstallLogCallback();
}

void av_init::InstallLogCallback() {
  if (!AllLoaded()) return;
  // The default printer goes back before the module can be unloaded: the
  // libraries may outlive it in the host's process.
  av_log_set_callback(m_routesLog ? &ForwardCodecLog : av_log_default_callback);
}

}  // namespace hx
