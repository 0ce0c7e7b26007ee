/* A stand-in for all five codec libraries at once, for loader tests: every
 * symbol the loader looks up, doing nothing, plus the registration functions
 * of old releases, which count their calls. Built a second time without
 * swr_get_delay to stand for a library that lacks one symbol. */
#include <libavcodec/version.h>
#include <libavfilter/version.h>
#include <libavformat/version.h>
#include <libavutil/version.h>
#include <libswresample/version.h>

#define STUB(name) \
  void name(void) {}

static int g_registerCalls[2];

void av_register_all(void) {
  ++g_registerCalls[0];
}
void avfilter_register_all(void) {
  ++g_registerCalls[1];
}
int stub_register_calls(int which) {
  return g_registerCalls[which];
}

unsigned avcodec_version(void) {
  return LIBAVCODEC_VERSION_INT;
}
unsigned avformat_version(void) {
  return LIBAVFORMAT_VERSION_INT;
}
unsigned avutil_version(void) {
  return LIBAVUTIL_VERSION_INT;
}
unsigned avfilter_version(void) {
  return LIBAVFILTER_VERSION_INT;
}
unsigned swresample_version(void) {
  return LIBSWRESAMPLE_VERSION_INT;
}

STUB(avcodec_find_decoder)
STUB(avcodec_find_encoder)
STUB(av_packet_alloc)
STUB(av_packet_free)
STUB(av_packet_unref)
STUB(av_new_packet)
STUB(av_get_bits_per_sample)
STUB(avcodec_send_packet)
STUB(avcodec_receive_frame)
STUB(avcodec_send_frame)
STUB(avcodec_receive_packet)
STUB(avcodec_alloc_context3)
STUB(avcodec_parameters_from_context)
STUB(avcodec_parameters_to_context)
STUB(avcodec_open2)
STUB(avcodec_is_open)
STUB(avcodec_close)
STUB(avcodec_free_context)
STUB(avcodec_decode_subtitle2)
STUB(avsubtitle_free)
STUB(av_parser_init)
STUB(av_parser_parse2)
STUB(av_parser_close)

STUB(avformat_alloc_context)
STUB(av_guess_format)
STUB(avio_open2)
STUB(avformat_new_stream)
STUB(avformat_write_header)
STUB(avformat_query_codec)
STUB(av_write_frame)
STUB(av_interleaved_write_frame)
STUB(avformat_open_input)
STUB(avformat_close_input)
STUB(av_read_frame)
STUB(av_write_trailer)
STUB(avio_close)
STUB(avio_closep)
STUB(avformat_free_context)
STUB(avformat_seek_file)

STUB(av_dict_set_int)
STUB(av_dict_set)
STUB(av_dict_free)
STUB(av_rescale_q)
STUB(av_d2q)
STUB(av_frame_alloc)
STUB(av_frame_free)
STUB(av_strdup)
STUB(av_mallocz)
STUB(av_get_pix_fmt_name)
STUB(av_channel_layout_default)
STUB(av_log_set_callback)
STUB(av_log_default_callback)

STUB(avfilter_graph_free)
STUB(av_buffersrc_add_frame_flags)
STUB(av_buffersink_get_frame)
STUB(avfilter_graph_alloc)
STUB(avfilter_graph_create_filter)
STUB(avfilter_get_by_name)
STUB(avfilter_inout_alloc)
STUB(avfilter_graph_parse_ptr)
STUB(avfilter_graph_config)
STUB(avfilter_inout_free)

STUB(swr_alloc_set_opts2)
STUB(swr_init)
STUB(swr_free)
STUB(swr_convert_frame)
#ifndef STUB_LACKS_SWR_GET_DELAY
STUB(swr_get_delay)
#endif
