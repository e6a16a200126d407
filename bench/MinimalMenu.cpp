// The yardstick for the console's figures: the smallest ncurses program that
// does what the console's screens do at their simplest. It draws a boxed
// screen with a title and a menu of 17 entries, moves a highlight with
// Up/Down, and ends on "q". Same library, same terminal, no host behind it.
#include <curses.h>
#include <locale.h>

int main() {
    setlocale(LC_ALL, "");
    initscr();
    start_color();
    cbreak();
    noecho();
    keypad(stdscr, TRUE);
    curs_set(0);
    init_pair(1, COLOR_BLACK, COLOR_YELLOW);
    init_pair(2, COLOR_WHITE, COLOR_BLACK);
    const char* entries[] = {"Configure Password",
                             "Configure Lockdown Mode",
                             "",
                             "Configure Devices",
                             "Configure Management Network",
                             "Restart Management Network",
                             "Test Management Network",
                             "Network Restore Options",
                             "",
                             "Configure Keyboard",
                             "Troubleshooting Options",
                             "",
                             "View System Logs",
                             "",
                             "View Support Information",
                             "",
                             "Reset System Configuration"};
    const int count = sizeof entries / sizeof entries[0];
    int current = 0;
    // Without colours the highlight is in reverse video, as the console's.
    const attr_t normal = has_colors() ? COLOR_PAIR(1) : A_NORMAL;
    const attr_t highlight = has_colors() ? COLOR_PAIR(2) : A_REVERSE;
    bkgd(normal);
    box(stdscr, 0, 0);
    mvaddstr(1, 3, "System Customization");
    for (;;) {
        for (int i = 0; i < count; ++i) {
            attrset(i == current ? highlight : normal);
            mvprintw(3 + i, 2, "%-36s", entries[i]);
        }
        refresh();
        int key = getch();
        if (key == 'q') break;
        int step = key == KEY_DOWN ? 1 : key == KEY_UP ? -1 : 0;
        for (int next = current + step; step && next >= 0 && next < count; next += step) {
            if (entries[next][0]) {
                current = next;
                break;
            }
        }
    }
    endwin();
    return 0;
}
