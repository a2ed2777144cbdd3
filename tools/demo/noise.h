// Pseudo-random numbers that are the same in every run.
#ifndef DEMO_NOISE_H
#define DEMO_NOISE_H

// Returns a number from 0 to 1 for each cell; each `seed` gives other numbers, here and below.
double hash_noise(int line, int samp, unsigned seed);

// Returns smooth noise of about -1 to 1: the sum of octaves, the first with one hill per unit, each
// of half the size and strength of the one before.
double fractal_noise(double line, double samp, int noctaves, unsigned seed);

// Returns 0 up to `low`, 1 from `high` on, and a smooth slope in between.
double smooth_step(double low, double high, double value);

#endif
