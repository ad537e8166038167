#!/bin/sh
# Makes the sample files in this folder with Debian's ffmpeg, from synthetic pictures and sound. Encoders and muxer run
# bit-exact in one thread, so that a second run with the same ffmpeg produces the same bytes.
# The expected results are then made by make_expected.py.
set -eu
cd "$(dirname "$0")"

video() { echo "-f lavfi -i testsrc=size=$1:rate=$2:duration=$3"; }
audio() { echo "-f lavfi -i sine=frequency=440:sample_rate=$1:duration=$2"; }

# make NAME ARGUMENTS...
make() {
    name=$1
    shift
    ffmpeg -nostdin -v error -y "$@" -threads 1 -filter_threads 1 -fflags +bitexact -flags:v +bitexact \
        -flags:a +bitexact -map_metadata -1 -f flv "$name.flv"
}

x264="-c:v libx264 -preset veryfast -crf 35 -pix_fmt yuv420p"
aac="-c:a aac -b:a 32k -ac 1"

# shellcheck disable=SC2046,SC2086
{
    make avc_aac $(video 160x120 25 2.5) $(audio 44100 2.5) $x264 -bf 0 -g 25 $aac -flvflags no_duration_filesize
    make avc_aac_index $(video 160x120 25 3) $(audio 44100 3) $x264 -bf 0 -g 10 $aac -flvflags add_keyframe_index
    make avc_bframes_aac $(video 160x120 25 2) $(audio 48000 2) $x264 -bf 2 -g 20 $aac -ac 2
    make avc_only $(video 96x80 25 2) $x264 -bf 0 -g 15
    make h263_mp3 $(video 160x120 15 2) $(audio 22050 2) -c:v flv -q:v 20 -g 10 -c:a libmp3lame -b:a 32k -ac 1
    make screen $(video 64x48 5 2) -c:v flashsv -g 5
    make aac_only $(audio 32000 2) $aac
    make mp3_only $(audio 44100 2) -c:a libmp3lame -b:a 32k -ac 2
    make speex_only $(audio 16000 2) -c:a libspeex -ac 1
    make pcm_only $(audio 11025 0.5) -c:a pcm_s16le -ac 1
}

# A download that ended in the middle of a tag, and a file with 700 bytes overwritten.
python3 - <<'PY'
sound = open("avc_aac.flv", "rb").read()
open("truncated.flv", "wb").write(sound[:len(sound) * 3 // 5 + 1])
damaged = bytearray(sound)
state = 12345
for i in range(len(sound) // 2, len(sound) // 2 + 700):
    state = (state * 1103515245 + 12345) & 0x7FFFFFFF
    damaged[i] = state >> 16 & 0xFF
open("damaged.flv", "wb").write(damaged)
PY
