// The codec libraries (FFmpeg's avcodec, avformat, avutil, avfilter and
// swresample), loaded at run time by file name and reached through the
// function pointers resolved here. The module never links them: without
// them, or with an incomplete set, it still runs and sends mail, only
// without video clips.
//
// One library is a LibWrapper; MultiLibWrapper loads a registered set as a
// whole; av_init is the set the module uses, with every library's function
// pointers as its members. av_init::Instance() is the process-wide set, made
// on first use. Nothing here takes a lock: the set is loaded and reloaded
// only on the notification worker, which writes one clip at a time, and
// every user checks AllLoaded() before calling through a pointer.
//
// Each library is the file of the major version (platform::SharedLibraryFileName:
// "lib<base>.so.<major>" on Linux, "<base>-<major>.dll" on Windows) the
// module was compiled for, and must report that version: the module reads
// the libraries' structures with the layout of its own headers, so no other
// release will do.
#ifndef ALERTMOD_VIDEO_AV_LIBS_H_
#define ALERTMOD_VIDEO_AV_LIBS_H_

#include <memory>
#include <string>
#include <vector>

#include "alertmod/host_records.h"
#include "alertmod/video/av_symbols.h"

extern "C" {
#include <libavcodec/avcodec.h>
#include <libavfilter/avfilter.h>
#include <libavfilter/buffersink.h>
#include <libavfilter/buffersrc.h>
#include <libavformat/avformat.h>
#include <libavutil/channel_layout.h>
#include <libavutil/dict.h>
#include <libavutil/frame.h>
#include <libavutil/log.h>
#include <libavutil/mathematics.h>
#include <libavutil/mem.h>
#include <libavutil/pixdesc.h>
#include <libswresample/swresample.h>
}

namespace hx {

// One library loaded at run time. Derived classes name the file, hold one
// function pointer per symbol and resolve them.
class LibWrapper {
 public:
  LibWrapper() = default;
  // Frees the library when it is loaded.
  virtual ~LibWrapper();
  LibWrapper(const LibWrapper&) = delete;
  LibWrapper& operator=(const LibWrapper&) = delete;

  // Loads the library and resolves its symbols. Returns true when a file was
  // loaded and every required symbol found. The base loads nothing.
  virtual bool Load() { return false; }
  // Called before and after the library is freed by Unload.
  virtual void BeforeUnload() {}
  virtual void AfterUnload() {}
  // Looks up every symbol in the loaded library; with none loaded, clears
  // every pointer. IsResolved() then tells whether all required ones exist.
  virtual void Resolve() = 0;
  virtual bool IsResolved() const = 0;

  // Frees the library (with the two hooks around it) and clears the pointers.
  void Unload();
  bool HasModule() const { return m_module != nullptr; }
  // Full name of the loaded file; empty when none is loaded.
  const std::string& LoadedFile() const { return m_loadedFile; }
  // Makes Load look only in `directory` instead of the system's search
  // path; empty restores the search path. Takes effect at the next Load.
  void SetDirectory(const std::string& directory) { m_directory = directory; }

 protected:
  // Loads the file of `baseName` and `builtMajor`; once loaded it replaces the file
  // loaded before. Returns true when it has every required symbol and its
  // `versionSymbol` reports `builtMajor`; a file of another major is freed
  // again. A file lacking a symbol stays loaded and the result is false.
  bool LoadFile(const char* baseName, int builtMajor, const char* versionSymbol);

  // Stores the address of `name` in `slot` (null when absent or nothing is
  // loaded) and returns whether it was found.
  template <typename Fn>
  bool Bind(const char* name, Fn& slot);

 private:
  void ReplaceModule(void* module, const std::string& file);
  bool IsBuiltMajor(const char* versionSymbol, int builtMajor) const;

  void* m_module = nullptr;
  std::string m_loadedFile;
  std::string m_directory;
};

// A library class has one function pointer per symbol of its list in
// av_symbols.h, named like the symbol and null until resolved.
#define ALERTMOD_AV_MEMBER(symbol) decltype(&::symbol) symbol = nullptr;
// The optional symbols are gone from the current headers, so their type is
// spelt out.
#define ALERTMOD_AV_OPTIONAL_MEMBER(symbol) void (*symbol)() = nullptr;

class AVCodecLib : public LibWrapper {
 public:
  bool Load() override;
  void Resolve() override;
  bool IsResolved() const override { return m_resolved; }

  ALERTMOD_AVCODEC_SYMBOLS(ALERTMOD_AV_MEMBER, ALERTMOD_AV_MEMBER, ALERTMOD_AV_OPTIONAL_MEMBER)

 private:
  bool m_resolved = false;
};

class AVFormatLib : public LibWrapper {
 public:
  bool Load() override;
  void Resolve() override;
  bool IsResolved() const override { return m_resolved; }

  ALERTMOD_AVFORMAT_SYMBOLS(ALERTMOD_AV_MEMBER, ALERTMOD_AV_MEMBER, ALERTMOD_AV_OPTIONAL_MEMBER)

 private:
  bool m_resolved = false;
};

class AVUtilLib : public LibWrapper {
 public:
  bool Load() override;
  void Resolve() override;
  bool IsResolved() const override { return m_resolved; }

  ALERTMOD_AVUTIL_SYMBOLS(ALERTMOD_AV_MEMBER, ALERTMOD_AV_MEMBER, ALERTMOD_AV_OPTIONAL_MEMBER)

 private:
  bool m_resolved = false;
};

class AVFilterLib : public LibWrapper {
 public:
  bool Load() override;
  void Resolve() override;
  bool IsResolved() const override { return m_resolved; }

  ALERTMOD_AVFILTER_SYMBOLS(ALERTMOD_AV_MEMBER, ALERTMOD_AV_MEMBER, ALERTMOD_AV_OPTIONAL_MEMBER)

 private:
  bool m_resolved = false;
};

class SWResampleLib : public LibWrapper {
 public:
  bool Load() override;
  void Resolve() override;
  bool IsResolved() const override { return m_resolved; }

  ALERTMOD_SWRESAMPLE_SYMBOLS(ALERTMOD_AV_MEMBER, ALERTMOD_AV_MEMBER, ALERTMOD_AV_OPTIONAL_MEMBER)

 private:
  bool m_resolved = false;
};

#undef ALERTMOD_AV_MEMBER
#undef ALERTMOD_AV_OPTIONAL_MEMBER

// A set of libraries that is only of use when every one of them is loaded.
class MultiLibWrapper {
 public:
  // One registered library, seen from the set.
  class IMultiLibHelper {
   public:
    virtual ~IMultiLibHelper() = default;
    // Runs the library's Load.
    virtual bool Load() = 0;
    // Frees the library and clears its pointers.
    virtual void Unload() = 0;
    // A library is loaded when its file is and every required symbol is.
    virtual bool IsLoaded() const = 0;
  };

  MultiLibWrapper() = default;
  virtual ~MultiLibWrapper();
  MultiLibWrapper(const MultiLibWrapper&) = delete;
  MultiLibWrapper& operator=(const MultiLibWrapper&) = delete;

  // Loads every registered library, even after one failed. Returns true when
  // at least one is registered and all succeeded.
  virtual bool LoadEach();
  // True when at least one library is registered and every one is loaded.
  bool AllLoaded() const;
  // Returns true at once when AllLoaded. Otherwise loads every library (all
  // are tried) and, when all succeeded, runs AfterAllLoaded and returns true.
  bool LoadAll();
  // Frees every library, then LoadAll. Returns LoadAll's result.
  bool Reload();

 protected:
  // Adds `library` to the set, after those registered before.
  template <typename Library>
  void Register(Library* library);
  // Runs once each time LoadAll completes the set.
  virtual void AfterAllLoaded() {}

 private:
  std::vector<std::unique_ptr<IMultiLibHelper>> m_helpers;
};

template <typename Library>
void MultiLibWrapper::Register(Library* library) {
  class Helper final : public IMultiLibHelper {
   public:
    explicit Helper(Library* lib) : m_lib(lib) {}
    bool Load() override { return m_lib->Load(); }
    void Unload() override { m_lib->Unload(); }
    bool IsLoaded() const override { return m_lib->HasModule() && m_lib->IsResolved(); }

   private:
    Library* m_lib;
  };
  m_helpers.push_back(std::make_unique<Helper>(library));
}

// The five codec libraries as one set; every symbol is a member.
class av_init final : public MultiLibWrapper,
                      public AVCodecLib,
                      public AVFormatLib,
                      public AVUtilLib,
                      public AVFilterLib,
                      public SWResampleLib {
 public:
  // Registers the five libraries and loads them, from `directory` when it is
  // not empty (tests), else along the system's search path.
  explicit av_init(const std::string& directory = std::string());
  // Gives the libraries' log back to their own printer when it was routed.
  ~av_init() override;

  // The process-wide set, loaded along the system's search path on the first
  // call. Lives until the module's static objects are destroyed.
  static av_init& Instance();

  // Makes the next loads look in `directory` (empty: the search path).
  void SetLibraryDirectory(const std::string& directory);

  // Sends the libraries' warnings and errors to `host`'s log at warning
  // level instead of standard error, now and after every later load; null
  // gives them back to the libraries' own printer. Their log is one per
  // process, so the last set to route it wins. Call it from one thread at a
  // time, as loads are.
  void RouteLogTo(core::HostCallbackFn host);

 private:
  void AfterAllLoaded() override;
  // Points the loaded libraries' log at the routed host, or back at their
  // own printer.
  void InstallLogCallback();

  bool m_routesLog = false;
};

}  // namespace hx

#endif  // ALERTMOD_VIDEO_AV_LIBS_H_
