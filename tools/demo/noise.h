// Randomness that is the same on every run.
#ifndef DEMO_NOISE_H
#define DEMO_NOISE_H

// One number per cell, 0..1; other ones for each `seed`, as below.
double hash_noise(int line, int samp, unsigned seed);

// Hills and hollows, one per unit, and octaves of them, each half as large and as strong as the
// one before; about -1..1.
double fractal_noise(double line, double samp, int noctaves, unsigned seed);

// 0 up to `from`, 1 from `to` on, and an easy slope between.
double smooth_step(double from, double to, double value);

#endif
