// Keeps the module's static objects alive while any of their users is.
#pragma once

void startStaticObjects();
void stopStaticObjects();
