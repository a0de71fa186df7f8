# French interjections that Lefff lists under other classes or not at all, written for
# this project (mkbdb's lexicon format). Their records come before Lefff's.
oui	interjection=oui
non	interjection/n=non
merci	interjection=merci
salut	interjection=salut
bravo	interjection=bravo
coucou	interjection=coucou
allô	interjection=allô
oh	interjection=oh
eh	interjection=eh
bah	interjection=bah
bof	interjection=bof
euh	interjection=euh
hein	interjection=hein
zut	interjection=zut
ouf	interjection=ouf
aïe	interjection=aïe
chut	interjection=chut
oups	interjection=oups
hop	interjection=hop
ouah	interjection=ouah
waouh	interjection=waouh
