# English closed classes, written for this project (mkbdb's lexicon format).
# Their records come before WordNet's for the same word.
a	determinant=a
an	determinant=an
the	determinant=the
every	determinant=every
each	determinant=each
either	determinant=either
neither	determinant=neither
another	determinant=another
this	determinant/s=this	pronoun/s=this
that	determinant/s=that	pronoun/s=that
these	determinant/p=these	pronoun/p=these
those	determinant/p=those	pronoun/p=those
my	determinant/1s=my
your	determinant/2=your
his	determinant/3ms=his
its	determinant/3s=its
our	determinant/1p=our
their	determinant/3p=their
her	pronoun_comp/3fs=her	determinant/3fs=her
some	determinant=some	pronoun=some
any	determinant=any	pronoun=any
much	determinant=much	pronoun=much
many	determinant=many	pronoun=many
more	determinant=more	pronoun=more
most	determinant=most	pronoun=most
few	determinant=few	pronoun=few
fewer	determinant=fewer	pronoun=fewer
less	determinant=less	pronoun=less
least	determinant=least	pronoun=least
several	determinant=several	pronoun=several
enough	determinant=enough	pronoun=enough
such	determinant=such	pronoun=such
whose	determinant=whose	pronoun=whose
all	determinant=all	pronoun=all
both	determinant=both	pronoun=both
half	determinant=half	pronoun=half
no	determinant/n=no	interjection/n=no
what	pronoun=what	determinant=what
which	pronoun=which	determinant=which
whatever	pronoun=whatever	determinant=whatever
whichever	pronoun=whichever	determinant=whichever
i	pronoun/1s=i
we	pronoun/1p=we
he	pronoun/3ms=he
she	pronoun/3fs=she
they	pronoun/3p=they
you	pronoun/2=you	pronoun_comp/2=you
it	pronoun/3s=it	pronoun_comp/3s=it
me	pronoun_comp/1s=me
him	pronoun_comp/3ms=him
us	pronoun_comp/1p=us
them	pronoun_comp/3p=them
myself	pronoun_comp/1s=myself
yourself	pronoun_comp/2s=yourself
himself	pronoun_comp/3ms=himself
herself	pronoun_comp/3fs=herself
itself	pronoun_comp/3s=itself
ourselves	pronoun_comp/1p=ourselves
yourselves	pronoun_comp/2p=yourselves
themselves	pronoun_comp/3p=themselves
oneself	pronoun_comp/3s=oneself
whom	pronoun_comp=whom
mine	pronoun=mine
yours	pronoun=yours
hers	pronoun=hers
ours	pronoun=ours
theirs	pronoun=theirs
who	pronoun=who
whoever	pronoun=whoever
whomever	pronoun=whomever
someone	pronoun=someone
somebody	pronoun=somebody
something	pronoun=something
anyone	pronoun=anyone
anybody	pronoun=anybody
anything	pronoun=anything
everyone	pronoun=everyone
everybody	pronoun=everybody
everything	pronoun=everything
nobody	pronoun=nobody
none	pronoun=none
one	pronoun=one
nothing	pronoun/n=nothing
i'm	pronoun=i
you're	pronoun=you
he's	pronoun=he
she's	pronoun=she
it's	pronoun=it
we're	pronoun=we
they're	pronoun=they
i've	pronoun=i
you've	pronoun=you
we've	pronoun=we
they've	pronoun=they
i'll	pronoun=i
you'll	pronoun=you
he'll	pronoun=he
she'll	pronoun=she
it'll	pronoun=it
we'll	pronoun=we
they'll	pronoun=they
i'd	pronoun=i
you'd	pronoun=you
he'd	pronoun=he
she'd	pronoun=she
we'd	pronoun=we
they'd	pronoun=they
that's	pronoun=that
what's	pronoun=what
there's	pronoun=there
here's	pronoun=here
who's	pronoun=who
where's	pronoun=where
let's	pronoun=let
about	preposition=about
above	preposition=above
across	preposition=across
after	preposition=after
against	preposition=against
along	preposition=along
amid	preposition=amid
among	preposition=among
amongst	preposition=amongst
around	preposition=around
as	preposition=as
at	preposition=at
before	preposition=before
behind	preposition=behind
below	preposition=below
beneath	preposition=beneath
beside	preposition=beside
besides	preposition=besides
between	preposition=between
beyond	preposition=beyond
by	preposition=by
despite	preposition=despite
down	preposition=down
during	preposition=during
except	preposition=except
for	preposition=for
from	preposition=from
in	preposition=in
inside	preposition=inside
into	preposition=into
like	preposition=like
near	preposition=near
of	preposition=of
off	preposition=off
on	preposition=on
onto	preposition=onto
opposite	preposition=opposite
out	preposition=out
outside	preposition=outside
over	preposition=over
past	preposition=past
per	preposition=per
since	preposition=since
than	preposition=than
through	preposition=through
throughout	preposition=throughout
till	preposition=till
to	preposition=to
toward	preposition=toward
towards	preposition=towards
under	preposition=under
underneath	preposition=underneath
unlike	preposition=unlike
until	preposition=until
up	preposition=up
upon	preposition=upon
via	preposition=via
with	preposition=with
within	preposition=within
without	preposition=without
concerning	preposition=concerning
regarding	preposition=regarding
including	preposition=including
and	conjunctive=and
or	conjunctive=or
but	conjunctive=but
nor	conjunctive=nor
yet	conjunctive=yet
so	conjunctive=so
although	sub_conj=although
because	sub_conj=because
if	sub_conj=if
once	sub_conj=once
though	sub_conj=though
unless	sub_conj=unless
when	sub_conj=when
whenever	sub_conj=whenever
where	sub_conj=where
whereas	sub_conj=whereas
wherever	sub_conj=wherever
whether	sub_conj=whether
while	sub_conj=while
whilst	sub_conj=whilst
lest	sub_conj=lest
be	auxiliary/W=be
am	auxiliary/P1s=be
is	auxiliary/P3s=be
are	auxiliary/P=be
was	auxiliary/J13s=be
were	auxiliary/J=be
been	auxiliary/K=be
being	auxiliary/G=be
have	auxiliary/WP=have
has	auxiliary/P3s=have
had	auxiliary/JK=have
having	auxiliary/G=have
do	auxiliary/WP=do
does	auxiliary/P3s=do
did	auxiliary/J=do
doing	auxiliary/G=do
done	auxiliary/K=do
can	auxiliary=can
could	auxiliary=could
may	auxiliary=may
might	auxiliary=might
must	auxiliary=must
shall	auxiliary=shall
should	auxiliary=should
will	auxiliary=will
would	auxiliary=would
ought	auxiliary=ought
don't	auxiliary/n=do
doesn't	auxiliary/n=do
didn't	auxiliary/n=do
can't	auxiliary/n=can
cannot	auxiliary/n=can
couldn't	auxiliary/n=can
won't	auxiliary/n=will
wouldn't	auxiliary/n=will
shouldn't	auxiliary/n=shall
shan't	auxiliary/n=shall
mustn't	auxiliary/n=must
mightn't	auxiliary/n=may
isn't	auxiliary/n=be
aren't	auxiliary/n=be
wasn't	auxiliary/n=be
weren't	auxiliary/n=be
hasn't	auxiliary/n=have
haven't	auxiliary/n=have
hadn't	auxiliary/n=have
ain't	auxiliary/n=be
needn't	auxiliary/n=need
not	adverb/n=not
never	adverb/n=never
hello	interjection=hello
hi	interjection=hi
hey	interjection=hey
bye	interjection=bye
goodbye	interjection=goodbye
oh	interjection=oh
ah	interjection=ah
wow	interjection=wow
yes	interjection=yes
yeah	interjection=yeah
yep	interjection=yep
nope	interjection=nope
okay	interjection=okay
ok	interjection=ok
please	interjection=please
thanks	interjection=thanks
oops	interjection=oops
ouch	interjection=ouch
hmm	interjection=hmm
huh	interjection=huh
uh	interjection=uh
um	interjection=um
alas	interjection=alas
hooray	interjection=hooray
bravo	interjection=bravo
cheers	interjection=cheers
sorry	interjection=sorry
ugh	interjection=ugh
whoa	interjection=whoa
yay	interjection=yay
hurray	interjection=hurray
one	determinant/p=one
two	determinant/p=two
three	determinant/p=three
four	determinant/p=four
five	determinant/p=five
six	determinant/p=six
seven	determinant/p=seven
eight	determinant/p=eight
nine	determinant/p=nine
ten	determinant/p=ten
eleven	determinant/p=eleven
twelve	determinant/p=twelve
thirteen	determinant/p=thirteen
fourteen	determinant/p=fourteen
fifteen	determinant/p=fifteen
sixteen	determinant/p=sixteen
seventeen	determinant/p=seventeen
eighteen	determinant/p=eighteen
nineteen	determinant/p=nineteen
twenty	determinant/p=twenty
thirty	determinant/p=thirty
forty	determinant/p=forty
fifty	determinant/p=fifty
sixty	determinant/p=sixty
seventy	determinant/p=seventy
eighty	determinant/p=eighty
ninety	determinant/p=ninety
hundred	determinant/p=hundred
thousand	determinant/p=thousand
million	determinant/p=million
billion	determinant/p=billion
# The prefix "non" ("non-POSIX") is no word of its own: no base form, so that it calls
# for no gesture.
non	adverb/n
