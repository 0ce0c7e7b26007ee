// Writes the video of one notification's capture as its e-mail attachment:
// a JPEG still for a motion-JPEG stream, or a clip in an MP4 (H.265) or
// QuickTime (MPEG-4 Part 2, H.264) file for the others. The frames go into
// the file as the camera sent them, without re-encoding.
//
// Called by the notification job on the worker thread, with a capture that
// is done (and therefore no longer changes).
#ifndef ALERTMOD_VIDEO_CLIP_WRITER_H_
#define ALERTMOD_VIDEO_CLIP_WRITER_H_

#include <cstdint>
#include <string>

#include "alertmod/host_records.h"
#include "alertmod/platform/env.h"
#include "alertmod/video/av_libs.h"
#include "alertmod/video/video_email_stream.h"

namespace hx {

// Writes `stream`'s clip to `path` (the extension picks the container:
// ".mov" or ".mp4") for a capture of codec 4, 5 or 6. `streamId` appears in
// log lines only; log lines go to the host through `callback` (may be
// null). Only the payload of each frame (the bytes from its payload offset
// on) reaches the file.
//
// Returns false, writing nothing, for any other codec (logged "Invalid codec
// type received."), and false when writing failed with an exception (logged).
// Returns true otherwise, also when no file could be written (codec
// libraries missing, file not creatable, nothing decodable): the caller
// checks that the file exists. A file that could not be finished is removed.
bool WriteVideoAttachment(uint32_t streamId, const CVideoEmailStream& stream,
                          const std::string& path, core::HostCallbackFn callback,
                          platform::Env& env, av_init& libs = av_init::Instance());

// Writes the payload of the clip's first frame (the bytes from its payload
// offset to the end of its buffer) to `path`, replacing any file there.
// Returns false when the clip is empty, `path` is empty, the first frame has
// lost its buffer or has no payload, or the file cannot be created or fully
// written.
bool WriteJpegAttachment(const CVideoEmailStream& stream, const std::string& path,
                         platform::Env& env);

}  // namespace hx

#endif  // ALERTMOD_VIDEO_CLIP_WRITER_H_
