// A generated landscape as seen by two sensors of a satellite.
#ifndef DEMO_SCENE_H
#define DEMO_SCENE_H

#include "picture.h"

struct scene {
    picture rgb;     // 8 bits in three bands
    picture gray12;  // 12 bits, near infrared, in a rotated frame; 0 outside the frame
};

scene make_scene();

#endif
