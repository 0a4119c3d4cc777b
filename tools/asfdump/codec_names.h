// Names of the host's codec codes without their prefix ("WMA2", "WVC1").
#pragma once

#include <string>

#include "hova_dmx.h"

namespace asfdump {

std::string audio_codec_name(int codec);
std::string video_codec_name(int codec);
// By stream type: audio codes for HOVA_STREAM_AUDIO, video codes otherwise.
std::string codec_name(hova_stream_type_et type, int codec);

}  // namespace asfdump
