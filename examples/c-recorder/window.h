#pragma once

#include <stdbool.h>
#include <stdint.h>

/* The example's window: a square that goes round. One thread. */
struct window;

/* NULL where there is no display. */
struct window* window_open(uint16_t width, uint16_t height);
void window_close(struct window* window);
/* Its X11 id. */
uint32_t window_identifier(const struct window* window);
/* Draws the picture of that time, in seconds. */
void window_draw(struct window* window, double seconds);
/* Takes what the server told meanwhile. False when the server has gone. */
bool window_dispatch(struct window* window);
/* Whether it has the focus. */
bool window_is_active(const struct window* window);
