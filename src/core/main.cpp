// Process entry of tolkd. Arguments and environment are not used: everything the
// daemon needs comes from system properties and the device itself.
#include "core/startup.h"

int main() { return tolkdMain(); }
