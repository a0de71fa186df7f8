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
# Elided words without their apostrophe: the analysis cuts "l'homme" into "l", the
# link "'" and "homme", and "n'" must read as the negation "n".
j	pronoun/1s=je
l	determinant/s=le	pronoun_comp/3s=le
n	adverb/n=ne
d	preposition=de	determinant/p=un
qu	sub_conj=que	pronoun=que
m	pronoun_comp/1s=me
t	pronoun_comp/2s=te
s	pronoun_comp/3=se
c	pronoun/3s=ce
jusqu	preposition=jusque
lorsqu	sub_conj=lorsque
puisqu	sub_conj=puisque
quoiqu	sub_conj=quoique
# Strong pronouns, whose base form Lefff gives as "lui"; their own serve as gesture tags.
moi	pronoun/1s=moi
toi	pronoun/2s=toi
soi	pronoun/3=soi
eux	pronoun/3mp=eux
# Verbs of computing that Lefff lacks, in the infinitive ("et de déboguer ses problèmes").
déboguer	verb/W=déboguer
désinstaller	verb/W=désinstaller
téléverser	verb/W=téléverser
