// Waiting. Both sleep for the whole time, also when signals arrive meanwhile.
#pragma once

void pause_seconds(int seconds);
void pause_milliseconds(int milliseconds);
