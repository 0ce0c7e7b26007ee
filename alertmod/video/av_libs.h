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
// Each library is the file "lib<base>.so.<major>" of the major version the
// module was compiled for, and must report that version: the module reads
// the libraries' structures with the layout of its own headers, so no other
// release will do.
#ifndef ALERTMOD_VIDEO_AV_LIBS_H_
#define ALERTMOD_VIDEO_AV_LIBS_H_

#include <memory>
#include <string>
#include <vector>

#include "alertmod/host_records.h"

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
  // Loads "lib<baseName>.so.<builtMajor>"; once loaded it replaces the file
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

class AVCodecLib : public LibWrapper {
 public:
  bool Load() override;
  void Resolve() override;
  bool IsResolved() const override { return m_resolved; }

  decltype(&::avcodec_version) avcodec_version = nullptr;
  decltype(&::avcodec_find_decoder) avcodec_find_decoder = nullptr;
  decltype(&::avcodec_find_encoder) avcodec_find_encoder = nullptr;
  decltype(&::av_packet_alloc) av_packet_alloc = nullptr;
  decltype(&::av_packet_free) av_packet_free = nullptr;
  decltype(&::av_packet_unref) av_packet_unref = nullptr;
  decltype(&::av_new_packet) av_new_packet = nullptr;
  decltype(&::av_get_bits_per_sample) av_get_bits_per_sample = nullptr;
  decltype(&::avcodec_send_packet) avcodec_send_packet = nullptr;
  decltype(&::avcodec_receive_frame) avcodec_receive_frame = nullptr;
  decltype(&::avcodec_send_frame) avcodec_send_frame = nullptr;
  decltype(&::avcodec_receive_packet) avcodec_receive_packet = nullptr;
  decltype(&::avcodec_alloc_context3) avcodec_alloc_context3 = nullptr;
  decltype(&::avcodec_parameters_from_context) avcodec_parameters_from_context = nullptr;
  decltype(&::avcodec_parameters_to_context) avcodec_parameters_to_context = nullptr;
  decltype(&::avcodec_open2) avcodec_open2 = nullptr;
  decltype(&::avcodec_is_open) avcodec_is_open = nullptr;
  decltype(&::avcodec_close) avcodec_close = nullptr;
  decltype(&::avcodec_free_context) avcodec_free_context = nullptr;
  decltype(&::avcodec_decode_subtitle2) avcodec_decode_subtitle2 = nullptr;
  decltype(&::avsubtitle_free) avsubtitle_free = nullptr;
  decltype(&::av_parser_init) av_parser_init = nullptr;
  decltype(&::av_parser_parse2) av_parser_parse2 = nullptr;
  decltype(&::av_parser_close) av_parser_close = nullptr;

 private:
  bool m_resolved = false;
};

class AVFormatLib : public LibWrapper {
 public:
  bool Load() override;
  void Resolve() override;
  bool IsResolved() const override { return m_resolved; }

  decltype(&::avformat_version) avformat_version = nullptr;
  // Only releases before FFmpeg 4 have it; optional.
  void (*av_register_all)() = nullptr;
  decltype(&::avformat_alloc_context) avformat_alloc_context = nullptr;
  decltype(&::av_guess_format) av_guess_format = nullptr;
  decltype(&::avio_open2) avio_open2 = nullptr;
  decltype(&::avformat_new_stream) avformat_new_stream = nullptr;
  decltype(&::avformat_write_header) avformat_write_header = nullptr;
  decltype(&::avformat_query_codec) avformat_query_codec = nullptr;
  decltype(&::av_write_frame) av_write_frame = nullptr;
  decltype(&::av_interleaved_write_frame) av_interleaved_write_frame = nullptr;
  decltype(&::avformat_open_input) avformat_open_input = nullptr;
  decltype(&::avformat_close_input) avformat_close_input = nullptr;
  decltype(&::av_read_frame) av_read_frame = nullptr;
  decltype(&::av_write_trailer) av_write_trailer = nullptr;
  decltype(&::avio_close) avio_close = nullptr;
  decltype(&::avio_closep) avio_closep = nullptr;
  decltype(&::avformat_free_context) avformat_free_context = nullptr;
  decltype(&::avformat_seek_file) avformat_seek_file = nullptr;

 private:
  bool m_resolved = false;
};

class AVUtilLib : public LibWrapper {
 public:
  bool Load() override;
  void Resolve() override;
  bool IsResolved() const override { return m_resolved; }

  decltype(&::avutil_version) avutil_version = nullptr;
  decltype(&::av_dict_set_int) av_dict_set_int = nullptr;
  decltype(&::av_dict_set) av_dict_set = nullptr;
  decltype(&::av_dict_free) av_dict_free = nullptr;
  decltype(&::av_rescale_q) av_rescale_q = nullptr;
  decltype(&::av_d2q) av_d2q = nullptr;
  decltype(&::av_frame_alloc) av_frame_alloc = nullptr;
  decltype(&::av_frame_free) av_frame_free = nullptr;
  decltype(&::av_strdup) av_strdup = nullptr;
  decltype(&::av_mallocz) av_mallocz = nullptr;
  decltype(&::av_get_pix_fmt_name) av_get_pix_fmt_name = nullptr;
  decltype(&::av_channel_layout_default) av_channel_layout_default = nullptr;
  decltype(&::av_log_set_callback) av_log_set_callback = nullptr;
  decltype(&::av_log_default_callback) av_log_default_callback = nullptr;

 private:
  bool m_resolved = false;
};

class AVFilterLib : public LibWrapper {
 public:
  bool Load() override;
  void Resolve() override;
  bool IsResolved() const override { return m_resolved; }

  decltype(&::avfilter_version) avfilter_version = nullptr;
  // Only releases before FFmpeg 4 have it; optional.
  void (*avfilter_register_all)() = nullptr;
  decltype(&::avfilter_graph_free) avfilter_graph_free = nullptr;
  decltype(&::av_buffersrc_add_frame_flags) av_buffersrc_add_frame_flags = nullptr;
  decltype(&::av_buffersink_get_frame) av_buffersink_get_frame = nullptr;
  decltype(&::avfilter_graph_alloc) avfilter_graph_alloc = nullptr;
  decltype(&::avfilter_graph_create_filter) avfilter_graph_create_filter = nullptr;
  decltype(&::avfilter_get_by_name) avfilter_get_by_name = nullptr;
  decltype(&::avfilter_inout_alloc) avfilter_inout_alloc = nullptr;
  decltype(&::avfilter_graph_parse_ptr) avfilter_graph_parse_ptr = nullptr;
  decltype(&::avfilter_graph_config) avfilter_graph_config = nullptr;
  decltype(&::avfilter_inout_free) avfilter_inout_free = nullptr;

 private:
  bool m_resolved = false;
};

class SWResampleLib : public LibWrapper {
 public:
  bool Load() override;
  void Resolve() override;
  bool IsResolved() const override { return m_resolved; }

  decltype(&::swresample_version) swresample_version = nullptr;
  decltype(&::swr_alloc_set_opts2) swr_alloc_set_opts2 = nullptr;
  decltype(&::swr_init) swr_init = nullptr;
  decltype(&::swr_free) swr_free = nullptr;
  decltype(&::swr_convert_frame) swr_convert_frame = nullptr;
  decltype(&::swr_get_delay) swr_get_delay = nullptr;

 private:
  bool m_resolved = false;
};

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
