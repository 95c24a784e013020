// Backspace editing of a host line, shared by the command filter and the merged SMS
// text: a BS byte (0x08) takes back the byte kept before it.
#ifndef TOLKD_CORE_LINE_EDIT_H
#define TOLKD_CORE_LINE_EDIT_H

// Edits the n bytes of line (room for n + 1) and returns the line's new length.
// A text line (no NUL within n) shortens by the bytes taken back, so a corrected
// command reaches routing whole. A line with an embedded NUL is a raw frame: only the
// text before the first NUL is edited and terminated in place, every byte from that
// NUL on stays where it was, and the length does not change.
int applyBackspaces(char *line, int n);

#endif
