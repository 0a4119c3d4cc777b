#include "codec_names.h"

#include <map>

#include "hova_codec.h"

namespace asfdump {

namespace {

std::string lookup(const std::map<int, std::string>& m, int codec) {
    auto it = m.find(codec);
    return it == m.end() ? "UNKNOWN" : it->second;
}

}  // namespace

std::string audio_codec_name(int codec) {
    static const std::map<int, std::string> names = {
        {-1, "ERROR"},
        {0, "UNKNOWN"},
        {1, "AAC"},
        {2, "AC3"},
        {3, "AC3_PES"},
        {4, "EAC3"},
        {5, "AMRNB"},
        {6, "AMRNBIF2"},
        {7, "AMRWB"},
        {8, "ATRC"},
        {9, "COOK"},
        {10, "DRA"},
        {11, "DTS"},
        {12, "DTS_HD"},
        {13, "DTS_HD_MA"},
        {14, "DTS_HD_HRA"},
        {15, "DTS_EXPRESS"},
        {16, "FLAC"},
        {17, "MIDI"},
        {18, "MP3"},
        {19, "ADPCM"},
        {20, "LPCM"},
        {21, "PCM"},
        {22, "SIPR"},
        {23, "WMA1"},
        {24, "WMA2"},
        {25, "WMA3"},
        {26, "WMA_VOICE"},
        {27, "WMA_LOSSLESS"},
        {28, "VORBIS"},
        {29, "TRUEHD"},
        {30, "OPUS"},
        {31, "ALAC"},
        {32, "BUFFER"},
        {33, "AAC_PES"},
        {34, "PCM_PES"},
        {35, "AC4"},
        {36, "MPEGH"},
        {37, "APE"},
    };
    return lookup(names, codec);
}

std::string video_codec_name(int codec) {
    static const std::map<int, std::string> names = {
        {-1, "ERROR"},
        {0, "UNKNOWN"},
        {1, "MP2V"},
        {2, "DIV3"},
        {3, "DIVX"},
        {4, "DX50"},
        {5, "H263"},
        {6, "IV32"},
        {7, "IV41"},
        {8, "M263"},
        {9, "M4V"},
        {10, "MP4S"},
        {11, "M4S2"},
        {12, "MP41"},
        {13, "MP42"},
        {14, "MP43"},
        {15, "WMV1"},
        {16, "WMV2"},
        {17, "WMV3"},
        {18, "WMVA"},
        {19, "WVC1"},
        {20, "AVC1"},
        {21, "MVC"},
        {22, "HEVC"},
        {23, "RVCH"},
        {24, "FLV1"},
        {25, "RV10"},
        {26, "RV20"},
        {27, "RV30"},
        {28, "RV40"},
        {29, "SVQ3"},
        {30, "AVS1"},
        {31, "AVS2"},
        {32, "MJPG"},
        {33, "MSVC"},
        {34, "VP60"},
        {35, "VP70"},
        {36, "VP80"},
        {37, "VP90"},
        {38, "DVSD"},
        {39, "I420"},
        {40, "BUFFER"},
        {41, "AVCP"},
        {42, "DVAVC1"},
        {43, "DVHEVC"},
        {44, "MSS2"},
        {45, "AV1"},
        {46, "DVAV1"},
    };
    return lookup(names, codec);
}

std::string codec_name(hova_stream_type_et type, int codec) {
    return type == HOVA_STREAM_AUDIO ? audio_codec_name(codec) : video_codec_name(codec);
}

}  // namespace asfdump
