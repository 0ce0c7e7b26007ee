/* The symbols the module looks up in each codec library, each named once.
 * The loader expands these lists into its function-pointer members and into
 * the lookups that fill them; the stand-in libraries of the loader tests
 * expand them into their stub functions. Plain C, so that both can include
 * it.
 *
 * Each list takes three macros, one per kind of symbol:
 *   VERSION(name)   the library's version function, required; the loader
 *                   also checks the major version it reports;
 *   REQUIRED(name)  a function the library must have;
 *   OPTIONAL(name)  a function of old releases only, taking and returning
 *                   nothing; a library without it still loads. */
#ifndef ALERTMOD_VIDEO_AV_SYMBOLS_H_
#define ALERTMOD_VIDEO_AV_SYMBOLS_H_

#define ALERTMOD_AVCODEC_SYMBOLS(VERSION, REQUIRED, OPTIONAL) \
  VERSION(avcodec_version)                                    \
  REQUIRED(avcodec_find_decoder)                              \
  REQUIRED(avcodec_find_encoder)                              \
  REQUIRED(av_packet_alloc)                                   \
  REQUIRED(av_packet_free)                                    \
  REQUIRED(av_packet_unref)                                   \
  REQUIRED(av_new_packet)                                     \
  REQUIRED(av_get_bits_per_sample)                            \
  REQUIRED(avcodec_send_packet)                               \
  REQUIRED(avcodec_receive_frame)                             \
  REQUIRED(avcodec_send_frame)                                \
  REQUIRED(avcodec_receive_packet)                            \
  REQUIRED(avcodec_alloc_context3)                            \
  REQUIRED(avcodec_parameters_from_context)                   \
  REQUIRED(avcodec_parameters_to_context)                     \
  REQUIRED(avcodec_open2)                                     \
  REQUIRED(avcodec_is_open)                                   \
  REQUIRED(avcodec_close)                                     \
  REQUIRED(avcodec_free_context)                              \
  REQUIRED(avcodec_decode_subtitle2)                          \
  REQUIRED(avsubtitle_free)                                   \
  REQUIRED(av_parser_init)                                    \
  REQUIRED(av_parser_parse2)                                  \
  REQUIRED(av_parser_close)

#define ALERTMOD_AVFORMAT_SYMBOLS(VERSION, REQUIRED, OPTIONAL) \
  VERSION(avformat_version)                                    \
  OPTIONAL(av_register_all)                                    \
  REQUIRED(avformat_alloc_context)                             \
  REQUIRED(av_guess_format)                                    \
  REQUIRED(avio_open2)                                         \
  REQUIRED(avformat_new_stream)                                \
  REQUIRED(avformat_write_header)                              \
  REQUIRED(avformat_query_codec)                               \
  REQUIRED(av_write_frame)                                     \
  REQUIRED(av_interleaved_write_frame)                         \
  REQUIRED(avformat_open_input)                                \
  REQUIRED(avformat_close_input)                               \
  REQUIRED(av_read_frame)                                      \
  REQUIRED(av_write_trailer)                                   \
  REQUIRED(avio_close)                                         \
  REQUIRED(avio_closep)                                        \
  REQUIRED(avformat_free_context)                              \
  REQUIRED(avformat_seek_file)

#define ALERTMOD_AVUTIL_SYMBOLS(VERSION, REQUIRED, OPTIONAL) \
  VERSION(avutil_version)                                    \
  REQUIRED(av_dict_set_int)                                  \
  REQUIRED(av_dict_set)                                      \
  REQUIRED(av_dict_free)                                     \
  REQUIRED(av_rescale_q)                                     \
  REQUIRED(av_d2q)                                           \
  REQUIRED(av_frame_alloc)                                   \
  REQUIRED(av_frame_free)                                    \
  REQUIRED(av_strdup)                                        \
  REQUIRED(av_mallocz)                                       \
  REQUIRED(av_get_pix_fmt_name)                              \
  REQUIRED(av_channel_layout_default)                        \
  REQUIRED(av_log_set_callback)                              \
  REQUIRED(av_log_default_callback)

#define ALERTMOD_AVFILTER_SYMBOLS(VERSION, REQUIRED, OPTIONAL) \
  VERSION(avfilter_version)                                    \
  OPTIONAL(avfilter_register_all)                              \
  REQUIRED(avfilter_graph_free)                                \
  REQUIRED(av_buffersrc_add_frame_flags)                       \
  REQUIRED(av_buffersink_get_frame)                            \
  REQUIRED(avfilter_graph_alloc)                               \
  REQUIRED(avfilter_graph_create_filter)                       \
  REQUIRED(avfilter_get_by_name)                               \
  REQUIRED(avfilter_inout_alloc)                               \
  REQUIRED(avfilter_graph_parse_ptr)                           \
  REQUIRED(avfilter_graph_config)                              \
  REQUIRED(avfilter_inout_free)

#define ALERTMOD_SWRESAMPLE_SYMBOLS(VERSION, REQUIRED, OPTIONAL) \
  VERSION(swresample_version)                                    \
  REQUIRED(swr_alloc_set_opts2)                                  \
  REQUIRED(swr_init)                                             \
  REQUIRED(swr_free)                                             \
  REQUIRED(swr_convert_frame)                                    \
  REQUIRED(swr_get_delay)

#endif /* ALERTMOD_VIDEO_AV_SYMBOLS_H_ */
