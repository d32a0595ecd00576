// Waiting.
#pragma once

// Sleeps for that many whole seconds, also when signals arrive meanwhile.
void pause_seconds(int seconds);
