/* A stand-in for all five codec libraries at once, for loader tests: every
 * symbol the loader looks up, doing nothing, plus the registration functions
 * of old releases, which count their calls. Built a second time without
 * swr_get_delay to stand for a library that lacks one symbol. */
#include <libavcodec/version.h>
#include <libavfilter/version.h>
#include <libavformat/version.h>
#include <libavutil/version.h>
#include <libswresample/version.h>

#include "alertmod/video/av_symbols.h"

#define STUB(name) \
  void name(void) {}

#ifdef STUB_LACKS_SWR_GET_DELAY
/* Its stub is then made under another name. */
#define swr_get_delay swr_get_delay_left_out
#endif

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

/* The version functions and the optional ones are written out above. */
#define NOT_STUBBED(name)
#define LISTED_STUBS(LIST) LIST(NOT_STUBBED, STUB, NOT_STUBBED)

LISTED_STUBS(ALERTMOD_AVCODEC_SYMBOLS)
LISTED_STUBS(ALERTMOD_AVFORMAT_SYMBOLS)
LISTED_STUBS(ALERTMOD_AVUTIL_SYMBOLS)
LISTED_STUBS(ALERTMOD_AVFILTER_SYMBOLS)
LISTED_STUBS(ALERTMOD_SWRESAMPLE_SYMBOLS)
