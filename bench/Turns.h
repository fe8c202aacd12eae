// Whose turn it is within a call of the library: its own, or that of a function that it calls. The functions
// of SQLite are defined here once more, ahead of the real ones: each has a turn of its own, but for the
// callbacks of rows, which are the library's.

#ifndef VEMO_ACCESS_TOKEN_BENCH_TURNS_H
#define VEMO_ACCESS_TOKEN_BENCH_TURNS_H

const int LIBRARY = 0; // the other turns are what the program numbers them

// The program defines these two: which turn a function of SQLite has ("open", "close", or else the
// statement's text), and what is to be done when a turn ends.
int turnOf(const char* szWhat);
void endTurn(int nTurn);

inline int g_nTurn = LIBRARY;

// Until the end of the scope somebody else's turn.
class Turn {
public:
    explicit Turn(int nTurn) : m_nBefore(g_nTurn) { pass(nTurn); }
    ~Turn() { pass(m_nBefore); }
    Turn(const Turn&) = delete;
    Turn& operator=(const Turn&) = delete;

private:
    static void pass(int nTurn)
    {
        endTurn(g_nTurn);
        g_nTurn = nTurn;
    }

    const int m_nBefore;
};

#endif
