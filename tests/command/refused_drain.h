#pragma once

/** Lets the next evbuffer_drain() in this process fail, without draining anything. */
void refuseNextDrain();
