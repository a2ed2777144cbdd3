// A made-up landscape as two sensors on a satellite would see it.
#ifndef DEMO_SCENE_H
#define DEMO_SCENE_H

#include "picture.h"

struct scene {
    picture rgb;     // 8 bits in three bands
    picture gray12;  // 12 bits of near infrared in a frame that stands askew; 0 outside it
};

scene make_scene();

#endif
